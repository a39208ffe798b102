// Text helpers and the shell runner.
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "sysaux.h"

extern "C" {

int System(const char* format, ...) {
  va_list arguments;
  char* command = nullptr;
  va_start(arguments, format);
  const int length = vasprintf(&command, format, arguments);
  va_end(arguments);
  if (length < 0) return -1;
  const int status = system(command);
  free(command);
  return status;
}

// Inside double quotes a shell interprets just these four, and takes them literally after a backslash (POSIX
// XCU 2.2.3). A newline needs none, and an exclamation mark is special to interactive shells only.
int str_insert_back_slash(char* out, size_t size, const char* text) {
  if (out == nullptr || size == 0) return -1;
  out[0] = '\0';
  if (text == nullptr) return -1;
  size_t used = 0;
  for (const char* from = text; *from != '\0'; from++) {
    const bool special = strchr("\"\\$`", *from) != nullptr;
    if (used + (special ? 2 : 1) >= size) {
      out[0] = '\0';
      return -1;
    }
    if (special) out[used++] = '\\';
    out[used++] = *from;
  }
  out[used] = '\0';
  return 0;
}

char* strrtrim(char* text, const char* set) {
  if (text == nullptr || set == nullptr) return text;
  size_t length = strlen(text);
  while (length > 0 && strchr(set, text[length - 1]) != nullptr) --length;
  text[length] = '\0';
  return text;
}

char* strtrim(char* text, const char* set) {
  if (text == nullptr || set == nullptr) return text;
  strrtrim(text, set);
  const size_t skip = strspn(text, set);
  memmove(text, text + skip, strlen(text + skip) + 1);
  return text;
}

long long str2ll(const char* text) {
  return text == nullptr ? 0 : strtoll(text, nullptr, 10);
}

}  // extern "C"
