#include "volume/mount_table.h"

#include <sys/sysmacros.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "support/files.h"
#include "support/memory.h"
#include "support/text.h"

namespace remvol {

namespace {

constexpr int kFieldsUpToPath = 5;

bool is_octal(char c) {
  return c >= '0' && c <= '7';
}

// The table writes blanks, tabs, newlines, backslashes and "#" as a backslash and three octal digits.
void undo_escapes(char* text) {
  char* out = text;
  for (const char* in = text; *in != '\0';) {
    if (in[0] == '\\' && is_octal(in[1]) && is_octal(in[2]) && is_octal(in[3])) {
      *out++ = static_cast<char>((in[1] - '0') << 6 | (in[2] - '0') << 3 | (in[3] - '0'));
      in += 4;
    } else {
      *out++ = *in++;
    }
  }
  *out = '\0';
}

// Cuts the next field off; "" when there is none. A field may be empty (a source is, when it was given so).
char* next_field(char** rest) {
  char* field = strsep(rest, " \n");
  if (field == nullptr) return const_cast<char*>("");
  undo_escapes(field);
  return field;
}

// Takes a line apart: "36 35 98:0 / /mnt/VV/a\040b rw,noatime master:1 - ext4 /dev/sdb1 rw". Returns false
// for a line of another form.
bool parse_line(char* line, MountLine* mount) {
  char* separator = strstr(line, " - ");
  if (separator == nullptr) return false;
  *separator = '\0';
  char* fields[kFieldsUpToPath];
  for (char*& field : fields) field = next_field(&line);
  unsigned major_number = 0;
  unsigned minor_number = 0;
  if (sscanf(fields[2], "%u:%u", &major_number, &minor_number) != 2) return false;
  mount->device = makedev(major_number, minor_number);
  copy_text(mount->path, fields[4]);
  char* rest = separator + strlen(" - ");
  copy_text(mount->type, next_field(&rest));
  copy_text(mount->source, next_field(&rest));
  return true;
}

using Fits = bool (*)(const MountLine& mount, const void* what);

Mounted search_table(Fits fits, const void* what, MountLine* mount) {
  const File table(fopen(kMountInfo, "re"));
  if (!table) return Mounted::kUnknown;
  char* buffer = nullptr;
  size_t size = 0;
  Mounted found = Mounted::kNo;
  while (found == Mounted::kNo && getline(&buffer, &size, table.get()) > 0) {
    if (parse_line(buffer, mount) && fits(*mount, what)) found = Mounted::kYes;
  }
  const Memory<char> owner(buffer);
  return found == Mounted::kNo && feof(table.get()) == 0 ? Mounted::kUnknown : found;
}

bool is_at_or_below(const MountLine& mount, const void* what) {
  const auto* root = static_cast<const char*>(what);
  const size_t length = strlen(root);
  return strncmp(mount.path, root, length) == 0 && (mount.path[length] == '\0' || mount.path[length] == '/');
}

struct DeviceAt {
  dev_t device;
  const char* path;
};

bool is_device_at(const MountLine& mount, const void* what) {
  const auto* wanted = static_cast<const DeviceAt*>(what);
  return mount.device == wanted->device && (wanted->path == nullptr || strcmp(mount.path, wanted->path) == 0);
}

}  // namespace

Mounted find_mount_below(const char* path, MountLine* mount) {
  return find_mount(is_at_or_below, path, mount);
}

// The table may miss lines while another process unmounts (until kernel 5.8): "not mounted" counts only when
// a second read says so too.
Mounted find_mount(Fits fits, const void* what, MountLine* mount) {
  const Mounted found = search_table(fits, what, mount);
  return found == Mounted::kNo ? search_table(fits, what, mount) : found;
}

Mounted find_mount_of(dev_t device, const char* path, MountLine* mount) {
  const DeviceAt wanted = {device, path};
  return find_mount(is_device_at, &wanted, mount);
}

}  // namespace remvol
