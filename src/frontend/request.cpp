#include "frontend/request.h"

namespace remvol {

TargetEntry request_target;
unsigned OPT_FLAG = 0;
const char* gs_str_command = nullptr;
int command_row = -1;
const char* output_file = nullptr;
int wait_seconds = 0;

}  // namespace remvol
