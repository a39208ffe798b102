#include "support/fuser.h"

#include "support/shell_text.h"

namespace remvol {

namespace {

constexpr char kEndUsers[] = "fuser -mk";

}  // namespace

CommandText end_users_command(const char* path) {
  return command_on_path(kEndUsers, path);
}

CommandText end_node_users_command(const char* node) {
  return command_on_node(kEndUsers, node);
}

}  // namespace remvol
