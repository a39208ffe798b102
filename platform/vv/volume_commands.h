// Commands that change volumes.
#ifndef PLATFORM_VV_VOLUME_COMMANDS_H
#define PLATFORM_VV_VOLUME_COMMANDS_H

#include "vv/options.h"

namespace vv {

int add(const Options& options);
int connect(const Options& options);
int disconnect(const Options& options);
int remove(const Options& options);
int format(const Options& options);

}  // namespace vv

#endif
