#include "volume/process_check.h"

#include <dirent.h>

#include <cctype>
#include <cstdio>
#include <cstring>

#include "frontend/log.h"
#include "support/files.h"
#include "support/text.h"

namespace remvol {

namespace {

CommandText process_list_command(const char* name) {
  return CommandText("ps -w | grep %s | grep -v 'grep'", name);
}

bool is_listed(const char* name, const char* device) {
  FILE* list = popen(process_list_command(name), "r");
  if (list == nullptr) return false;
  char line[1024];
  bool found = false;
  while (!found && fgets(line, sizeof line, list) != nullptr) {
    LOG(2, "get ps mke2fs buf = %s", line);
    found = strstr(line, device) != nullptr;
  }
  pclose(list);
  return found;
}

// Reads the file `field` of the process; parts that end in NUL are joined by blanks.
bool read_process(const char* pid, const char* field, char (&text)[4096]) {
  const File file(fopen(PathText("/proc/%s/%s", pid, field), "re"));
  if (!file) return false;
  const size_t length = fread(text, 1, sizeof text - 1, file.get());
  text[length] = '\0';
  for (size_t i = 0; i < length; i++) {
    if (text[i] == '\0') text[i] = ' ';
  }
  text[strcspn(text, "\n")] = '\0';
  return true;
}

}  // namespace

bool has_process(const char* name, const char* device) {
  const Directory processes(opendir("/proc"));
  if (!processes) return false;
  while (const dirent* process = readdir(processes.get())) {
    char text[4096];
    if (isdigit(static_cast<unsigned char>(process->d_name[0])) == 0) continue;
    if (!read_process(process->d_name, "comm", text) || strcmp(text, name) != 0) continue;
    if (read_process(process->d_name, "cmdline", text) && strstr(text, device) != nullptr) return true;
  }
  return false;
}

// The `ps -w` of procps lists no arguments, and only processes of the caller's own terminal: there the device
// is found in the process's own files.
bool is_command_running_on(const char* name, const char* device) {
  return is_listed(name, device) || has_process(name, device);
}

}  // namespace remvol
