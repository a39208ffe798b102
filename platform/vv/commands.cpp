#include "vv/commands.h"

#include <cstring>

#include "vv/search_commands.h"
#include "vv/target_commands.h"
#include "vv/volume_commands.h"

namespace vv {
namespace {

constexpr Command kCommands[] = {
    {"discover", "PORTAL", 0, 0, discover, "lists the targets that a portal offers"},
    {"luns", "TARGET|SHARE", kPortal | kUser, 0, luns, "lists a target's LUNs"},
    {"add", "NAME", kPortal | kTarget | kLun | kUser, kLun, add, "makes a LUN a share of that name"},
    {"connect", "SHARE|TARGET", 0, 0, connect, "logs in, and mounts the target's volumes"},
    {"disconnect", "SHARE|TARGET", kYes, 0, disconnect, "unmounts the target's volumes, and logs out"},
    {"format", "SHARE", kDestroyData | kYes, 0, format, "makes a new file system on the share's LUN"},
    {"delete", "SHARE|TARGET", kYes, 0, remove, "ends its use here; the server keeps the data"},
    {"rename-portal", "SHARE|TARGET", kPortal, kPortal, rename_portal, "the target is at another portal now"},
    {"password", "SHARE|TARGET", kUser | kNoPassword | kYes, 0, password,
     "changes the user and the password of the target"},
    {"status", nullptr, 0, 0, status, "how the volumes are, and what is wrong: vvstat(1)"},
};

}  // namespace

std::span<const Command> commands() {
  return kCommands;
}

const Command* find_command(const char* name) {
  for (const Command& command : commands()) {
    if (strcmp(command.name, name) == 0) return &command;
  }
  return nullptr;
}

}  // namespace vv
