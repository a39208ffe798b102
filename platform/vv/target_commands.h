// Commands that change how a target is reached.
#ifndef PLATFORM_VV_TARGET_COMMANDS_H
#define PLATFORM_VV_TARGET_COMMANDS_H

#include "vv/options.h"

namespace vv {

int password(const Options& options);
int rename_portal(const Options& options);

}  // namespace vv

#endif
