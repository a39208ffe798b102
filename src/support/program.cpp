#include "support/program.h"

#include <cstring>

namespace remvol {

char program_path[4096];

const char* program_name() {
  const char* slash = strrchr(program_path, '/');
  return slash != nullptr ? slash + 1 : program_path;
}

}  // namespace remvol
