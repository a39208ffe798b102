#include "support/flashrun.h"

namespace remvol {

CommandText copy_to_flash_command(const char* path) {
  return CommandText("flashrun \"cp -f %s /usr/local/config/\"", path);
}

}  // namespace remvol
