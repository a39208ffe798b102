// The system utilities and the LAN query of the platform.
#include "sysaux.h"

#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "fakes.h"
#include "ostel_common.h"

namespace {

using fakes::Answer;

int query(const char* function, const char* subject, int refused) {
  Answer answer;
  return fakes::needs_answer(function, {subject}, &answer) ? static_cast<int>(answer.result) : refused;
}

int text_query(const char* function, const char* subject, char* out, size_t size) {
  Answer answer;
  out[0] = '\0';
  if (!fakes::needs_answer(function, {subject}, &answer)) return -1;
  snprintf(out, size, "%s", answer.text.c_str());
  return static_cast<int>(answer.result);
}

}  // namespace

extern "C" {

int System(const char* format, ...) {
  char command[8192];
  va_list list;
  va_start(list, format);
  vsnprintf(command, sizeof command, format, list);
  va_end(list);
  return system(command);
}

int str_insert_back_slash(char* out, size_t size, const char* text) {
  Answer answer;
  std::string escaped;
  if (fakes::answered("str_insert_back_slash", {text}, &answer)) {
    snprintf(out, size, "%s", answer.text.c_str());
    return static_cast<int>(answer.result);
  }
  for (; *text != '\0'; text++) {
    if (strchr("$`\"\\", *text) != nullptr) escaped += '\\';
    escaped += *text;
  }
  const bool fits = escaped.size() < size;
  if (size > 0) snprintf(out, size, "%s", fits ? escaped.c_str() : "");
  return fits ? 0 : -1;
}

char* strrtrim(char* text, const char* set) {
  size_t length = strlen(text);
  while (length > 0 && strchr(set, text[length - 1]) != nullptr) text[--length] = '\0';
  return text;
}

char* strtrim(char* text, const char* set) {
  const size_t left = strspn(text, set);
  memmove(text, text + left, strlen(text + left) + 1);
  return strrtrim(text, set);
}

long long str2ll(const char* text) {
  return strtoll(text, nullptr, 10);
}

// The text of the rule is "aa:bb:cc:dd:ee:ff".
int sys_get_mac_addr(const char* interface, unsigned char mac[6]) {
  char text[64];
  const int result = text_query("sys_get_mac_addr", interface, text, sizeof text);
  if (result == 0) {
    sscanf(text, "%hhx:%hhx:%hhx:%hhx:%hhx:%hhx", &mac[0], &mac[1], &mac[2], &mac[3], &mac[4], &mac[5]);
  }
  return result;
}

int sys_hostname(char* out, size_t size) {
  return text_query("sys_hostname", "", out, size);
}

long long sys_get_disk_space(const char* format, ...) {
  Answer answer;
  char path[4096];
  va_list list;
  va_start(list, format);
  vsnprintf(path, sizeof path, format, list);
  va_end(list);
  return fakes::needs_answer("sys_get_disk_space", {path}, &answer) ? answer.result : 0;
}

int sys_get_partition_list(char* out, const char* device) {
  return text_query("sys_get_partition_list", device, out, 1024);
}

int sys_create_1_partition(const char* device) {
  fakes::record("sys_create_1_partition", {device});
  return query("sys_create_1_partition", device, -1);
}

int sys_expand_1_partition(const char* device) {
  fakes::record("sys_expand_1_partition", {device});
  return query("sys_expand_1_partition", device, -1);
}

long long sys_get_partition_size(const char* name) {
  Answer answer;
  return fakes::needs_answer("sys_get_partition_size", {name}, &answer) ? answer.result : 0;
}

int sys_check_dev(const char* node) {
  return query("sys_check_dev", node, -1);
}

int sys_get_fs_type(char* out, const char* node) {
  return text_query("sys_get_fs_type", node, out, 16);
}

int sys_check_fs_state(const char* node) {
  return query("sys_check_fs_state", node, 0);
}

int sys_mount_point(const char* path) {
  return query("sys_mount_point", path, 0);
}

// The text of the rule is "TOTAL USED AVAILABLE".
int sys_get_df_info(const char* path, unsigned long long* total, unsigned long long* used,
                    unsigned long long* available) {
  char text[128];
  const int result = text_query("sys_get_df_info", path, text, sizeof text);
  if (result == 0) sscanf(text, "%llu %llu %llu", total, used, available);
  return result;
}

int LIB_Get_Lan_Link_Speed(int port) {
  return query("LIB_Get_Lan_Link_Speed", std::to_string(port).c_str(), 0);
}

}  // extern "C"
