#include "iscsi/kmod.h"

namespace remvol {

namespace {

constexpr char kModuleFolder[] = "/usr/local/modules/driver";

}  // namespace

CommandText load_module_command(const char* module) {
  return CommandText("insmod %s/%s", kModuleFolder, module);
}

CommandText unload_module_command(const char* module) {
  return CommandText("rmmod %s", module);
}

CommandText unload_module_quietly_command(const char* module) {
  return CommandText("rmmod %s 1>/dev/null 2>/dev/null", module);
}

}  // namespace remvol
