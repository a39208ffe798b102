// The request: the parsed command line, process-wide. The front end alone writes and reads it; the handlers
// get what they need of it from the command table, as arguments.
#ifndef REMVOL_FRONTEND_REQUEST_H
#define REMVOL_FRONTEND_REQUEST_H

#include "tree/record.h"

namespace remvol {

// Bits of OPT_FLAG, one for each parameter option. 0x10 is never set.
enum OptionBit : unsigned {
  kOptName = 0x01,
  kOptChap = 0x02,
  kOptAddress = 0x04,
  kOptPort = 0x08,
  kOptShare = 0x20,
  kOptLun = 0x40,
};

extern TargetEntry request_target;  // the fields that the options set; the others are zero
extern unsigned OPT_FLAG;
extern const char* gs_str_command;  // name of the long option that chose the command; null until one is given
extern int command_row;             // its row in the command table; -1 until one is given
extern const char* output_file;     // argument of -o; null when absent
extern int wait_seconds;            // argument of -w

}  // namespace remvol

#endif
