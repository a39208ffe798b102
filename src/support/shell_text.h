// Text from outside in shell commands: it reaches the shell only as text.
#ifndef REMVOL_SUPPORT_SHELL_TEXT_H
#define REMVOL_SUPPORT_SHELL_TEXT_H

#include "support/text.h"

namespace remvol {

// What stands in place of a command that is refused: it does nothing and fails.
inline constexpr char kRefusedCommand[] = "false";

// Returns whether `text` can stand in a command without quotes: letters, digits and ".:,_@%+=/[]-", no "-" at
// its beginning, where it would be taken for an option. The empty text can.
[[nodiscard]] bool is_plain_word(const char* text);

// Composes a shell command from a template with %s and %d alone. A %s takes what its place in the template
// allows:
//   between double quotes   every text: what the shell reads inside them is escaped
//   between single quotes   no "'", which would end them, no "\", which some echo reads, no control character
//   without quotes          a plain word
// Another value, or a command that grows too long, is refused: logged at level 0, and the command that comes
// back is kRefusedCommand.
[[nodiscard, gnu::format(printf, 1, 2)]] CommandText shell_command(const char* format, ...);

// Returns the command `verb NODE` for a node without quotes, which must be a plain word.
[[nodiscard]] CommandText command_on_node(const char* verb, const char* node);

// Returns the command `verb "path"`, the path escaped. A path too long for that (more than 1,023 characters
// that all need escaping) gives a command that does nothing and fails.
[[nodiscard]] CommandText command_on_path(const char* verb, const char* path);

}  // namespace remvol

#endif
