#include "frontend/log.h"

#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace remvol {

namespace {

// A CHAP secret stands behind this in the command that stores it.
constexpr char kSecretSetting[] = "node.session.auth.password -v \"";

// Returns the quote that ends an escaped text, or its end.
const char* end_of_quoted(const char* text) {
  while (*text != '\0' && *text != '"') text += text[0] == '\\' && text[1] != '\0' ? 2 : 1;
  return text;
}

// Here rather than where commands are run: no message of any module can show a secret.
void print_without_secrets(const char* text) {
  while (const char* setting = strstr(text, kSecretSetting)) {
    const char* const secret = setting + strlen(kSecretSetting);
    printf("%.*s%s", static_cast<int>(secret - text), text, kMaskedSecret);
    text = end_of_quoted(secret);
  }
  fputs(text, stdout);
}

}  // namespace

int debug_level = 0;

void log_prefix(int level, const char* file, const char* function, int line) {
  if (debug_level >= level) printf("(%s:%s:%d): ", file, function, line);
  fflush(stdout);
}

void log_message(int level, const char* file, const char* function, int line, const char* format, ...) {
  log_prefix(level, file, function, line);
  if (debug_level >= level) {
    char* text = nullptr;
    va_list arguments;
    va_start(arguments, format);
    if (vasprintf(&text, format, arguments) < 0) text = nullptr;
    va_end(arguments);
    print_without_secrets(text != nullptr ? text : format);
    free(text);
    putchar('\n');
  }
  fflush(stdout);
}

}  // namespace remvol
