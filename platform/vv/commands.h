// The commands.
#ifndef PLATFORM_VV_COMMANDS_H
#define PLATFORM_VV_COMMANDS_H

#include <span>

#include "vv/options.h"

namespace vv {

// All of them, in the order of the help text.
std::span<const Command> commands();

}  // namespace vv

#endif
