// Text of users as UTF-8, whatever locale the program runs in.
#ifndef PLATFORM_COMMON_UTF8_H
#define PLATFORM_COMMON_UTF8_H

#include <string>
#include <string_view>

namespace platform {

// True for what most text is: a byte is a character and takes one cell, and no locale has to be read from a
// file to know that.
bool is_printable_ascii(std::string_view text);

// Puts the characters of `text` into `characters`. Returns false when it is not UTF-8; there are none then.
bool decode(std::string_view text, std::wstring& characters);

// True for what moves a cursor or ends a line instead of being shown.
bool is_control(wchar_t character);

// True for what has no shape of its own or turns the text around it: two texts that differ in such characters
// alone look the same, or one looks like another.
bool is_invisible(wchar_t character);

// The same for the character at `at`, except for what belongs to the script there: words of some scripts hold
// a joiner or its opposite, and emoji a joiner or what chooses their form. None of them stands behind ASCII
// except in a key cap, which its own mark follows.
bool is_hidden(std::wstring_view characters, size_t at);

// The character in lower case.
wchar_t lower_case(wchar_t character);

// The terminal cells that the text takes.
size_t cells(std::string_view text);

// The bytes of the first whole characters of the text that take at most `most` cells, with the marks that
// belong to them.
size_t first_cells(std::string_view text, size_t most);

// `text` as it may stand on a line: control and invisible characters as \xHH, and all that is not ASCII as
// well when it is not UTF-8.
std::string printable(std::string_view text);

// `text` with all that is not ASCII as \xHH.
std::string ascii(std::string_view text);

}  // namespace platform

#endif
