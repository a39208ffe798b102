// The request record: the parsed command line, process-wide, filled by the front end before a handler runs.
#ifndef REMVOL_FRONTEND_REQUEST_H
#define REMVOL_FRONTEND_REQUEST_H

#include "tree/record.h"

namespace remvol {

// Bits of OPT_FLAG, one a parameter option. 0x10 is never set.
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
extern char program_path[4096];     // argv[0]
extern const char* output_file;     // argument of -o; null when absent

// Returns the last component of `program_path`: the text after its last slash, or all of it. The tool's
// temporary files are named after it.
const char* program_name();

}  // namespace remvol

#endif
