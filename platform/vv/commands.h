// The commands.
#ifndef PLATFORM_VV_COMMANDS_H
#define PLATFORM_VV_COMMANDS_H

#include <span>

#include "vv/options.h"

namespace vv {

// All of them, in the order of the help text.
std::span<const Command> commands();

// The command of that name; null when there is none.
const Command* find_command(const char* name);

}  // namespace vv

#endif
