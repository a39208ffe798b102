#include "support/shell_text.h"

#include <cstdarg>
#include <cstring>

#include "frontend/log.h"
#include "sysaux.h"

namespace remvol {

namespace {

constexpr char kPlainCharacters[] =
    "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789.:,_@%+=/[]-";
constexpr char kNoQuote = '\0';

// A command in the making.
struct Composition {
  CommandText text;
  size_t length = 0;
  char quote = kNoQuote;  // the quotes that the template has opened
};

bool append(Composition* command, const char* text) {
  const size_t length = strlen(text);
  if (length >= CommandText::size() - command->length) return false;
  memcpy(command->text.data() + command->length, text, length + 1);
  command->length += length;
  return true;
}

bool append_escaped(Composition* command, const char* value) {
  char escaped[CommandText::size()];
  return str_insert_back_slash(escaped, sizeof escaped, value) == 0 && append(command, escaped);
}

bool can_stand_in_single_quotes(const char* value) {
  for (; *value != '\0'; value++) {
    const unsigned char character = static_cast<unsigned char>(*value);
    if (character == '\'' || character == '\\' || character < ' ' || character == '\x7f') return false;
  }
  return true;
}

bool append_value(Composition* command, const char* value) {
  if (command->quote == '"') return append_escaped(command, value);
  const bool fits = command->quote == '\'' ? can_stand_in_single_quotes(value) : is_plain_word(value);
  return fits && append(command, value);
}

bool append_character(Composition* command, char character) {
  if (command->quote == character) {
    command->quote = kNoQuote;
  } else if (command->quote == kNoQuote && (character == '"' || character == '\'')) {
    command->quote = character;
  }
  const char text[] = {character, '\0'};
  return append(command, text);
}

bool compose(Composition* command, const char* format, va_list values) {
  bool fits = true;
  for (; fits && *format != '\0'; format++) {
    if (*format != '%') {
      fits = append_character(command, *format);
      continue;
    }
    format++;
    fits = *format == 'd' ? append(command, NumberText("%d", va_arg(values, int)))
                          : append_value(command, va_arg(values, const char*));
  }
  return fits;
}

// The values stay untold: one of them may be a secret.
CommandText refuse(const char* command) {
  const LogScope scope;
  LOG(0, "cmd '%s' is refused, a value in it is no plain text", command);
  return CommandText("%s", kRefusedCommand);
}

}  // namespace

bool is_plain_word(const char* text) {
  return text[0] != '-' && text[strspn(text, kPlainCharacters)] == '\0';
}

CommandText shell_command(const char* format, ...) {
  Composition command;
  va_list values;
  va_start(values, format);
  const bool fits = compose(&command, format, values);
  va_end(values);
  return fits ? command.text : refuse(format);
}

CommandText command_on_node(const char* verb, const char* node) {
  return is_plain_word(node) ? CommandText("%s %s", verb, node) : refuse(verb);
}

CommandText command_on_path(const char* verb, const char* path) {
  char escaped[CommandText::size() / 2];
  if (str_insert_back_slash(escaped, sizeof escaped, path) != 0) return CommandText("%s", kRefusedCommand);
  return CommandText("%s \"%s\"", verb, escaped);
}

}  // namespace remvol
