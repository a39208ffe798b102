#include "frontend/request.h"

#include <cstring>

namespace remvol {

TargetEntry request_target;
unsigned OPT_FLAG = 0;
const char* gs_str_command = nullptr;
char program_path[4096];
const char* output_file = nullptr;

const char* program_name() {
  const char* slash = strrchr(program_path, '/');
  return slash != nullptr ? slash + 1 : program_path;
}

}  // namespace remvol
