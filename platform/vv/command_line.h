// The command line.
#ifndef PLATFORM_VV_COMMAND_LINE_H
#define PLATFORM_VV_COMMAND_LINE_H

#include "vv/options.h"

namespace vv {

// Reads the command line. Returns -1 to go on, or the exit status to end with.
int read_options(int argc, char** argv, Options& options);

}  // namespace vv

#endif
