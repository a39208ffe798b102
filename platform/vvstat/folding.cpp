#include "vvstat/folding.h"

#include <algorithm>

#include "common/utf8.h"

namespace vvstat {
namespace {

constexpr size_t kNarrow = 20;  // cells

// Lines that are filled from left to right.
class Lines {
 public:
  Lines(Indents indents, size_t width) : width_(std::max<size_t>(1, width)), indents_(indents) {
    if (width_ < kNarrow) indents_ = {};
    begin(indents_.first);
  }

  bool empty() const { return empty_; }
  size_t room() const { return width_ - std::min(width_, column_); }
  size_t longest() const { return width_ - indents_.further; }

  void put(std::string_view text) { put(text, platform::cells(text)); }

  // The same where its cells are known.
  void put(std::string_view text, size_t cells) {
    text_ += text;
    column_ += cells;
    empty_ = false;
  }

  void next_line() { next_line(indents_.further); }

  void next_line(size_t indent) {
    text_ += '\n';
    begin(indent);
  }

  std::string ended() { return std::move(text_) + '\n'; }

 private:
  void begin(size_t indent) {
    text_.append(indent, ' ');
    column_ = indent;
    empty_ = true;
  }

  size_t width_;
  Indents indents_;
  std::string text_;
  size_t column_ = 0;
  bool empty_ = true;  // the last line
};

// The bytes of the first character, with its marks.
size_t size_of_character(std::string_view text) {
  const size_t narrow = platform::first_cells(text, 1);
  return narrow != 0 ? narrow : std::max<size_t>(1, platform::first_cells(text, 2));
}

void put_broken(std::string_view word, Lines& lines) {
  while (!word.empty()) {
    const size_t size = std::max(platform::first_cells(word, lines.room()), size_of_character(word));
    lines.put(word.substr(0, size));
    word.remove_prefix(size);
    if (!word.empty()) lines.next_line();
  }
}

// What of a command stays together: a character, or a backslash with what it takes the meaning of.
size_t size_of_atom(std::string_view command, bool is_quoted) {
  if (!is_quoted && command.size() > 1 && command.front() == '\\') return 2;
  return size_of_character(command);
}

// The cells of the word at the front.
size_t cells_of_word(std::string_view command) {
  size_t at = 0;
  for (bool is_quoted = false; at < command.size() && (is_quoted || command[at] != ' ');) {
    if (command[at] == '\'') is_quoted = !is_quoted;
    at += !is_quoted && command[at] == '\\' ? 2 : 1;
  }
  return platform::cells(command.substr(0, at));
}

constexpr size_t kLongestEnd = 3;  // cells

// What has to stand behind an atom at the end of a line: " \" between words; within a word "\", before which
// a quotation mark closes the word.
size_t cells_of_end(std::string_view rest, bool is_quoted) {
  if (is_quoted) return rest == "'" ? 1 : kLongestEnd;
  return rest.empty() ? 0 : 2;
}

void put_blank(std::string_view rest, Lines& lines) {
  const size_t word = cells_of_word(rest), end = 2;
  // A word that is broken anyhow begins where there is room.
  const bool is_broken = word + end > lines.longest() && lines.room() > lines.longest() / 2;
  if (1 + word + end <= lines.room() || (rest.size() == word && 1 + word <= lines.room()) || is_broken) {
    lines.put(" ");
  } else {
    lines.put(" \\");
    lines.next_line();
  }
}

}  // namespace

std::string folded(std::string_view text, Indents indents, size_t width) {
  Lines lines(indents, width);
  while (!text.empty()) {
    const std::string_view word = text.substr(0, text.find(' '));
    const size_t cells = platform::cells(word), blank = lines.empty() ? 0 : 1;
    if (!lines.empty() && cells + blank > lines.room()) {
      lines.next_line();
    } else if (blank != 0) {
      lines.put(" ", 1);
    }
    cells > lines.room() ? put_broken(word, lines) : lines.put(word, cells);
    text.remove_prefix(std::min(word.size() + 1, text.size()));
  }
  return lines.ended();
}

std::string folded_command(std::string_view command, Indents indents, size_t width) {
  Lines lines(indents, width);
  // Where the longest end of a line has room behind all of it, there is none to be looked for.
  const size_t cells = platform::cells(command);
  if (cells + kLongestEnd <= lines.room()) {
    lines.put(command, cells);
    return lines.ended();
  }
  bool is_quoted = false;
  while (!command.empty()) {
    const std::string_view atom = command.substr(0, size_of_atom(command, is_quoted));
    command.remove_prefix(atom.size());
    if (!is_quoted && atom == " ") {
      put_blank(command, lines);
      continue;
    }
    const bool is_mark = atom == "'";
    if (!lines.empty() &&
        platform::cells(atom) + cells_of_end(command, is_quoted != is_mark) > lines.room()) {
      lines.put(is_quoted ? "'\\" : "\\");
      lines.next_line(0);
      if (is_quoted) lines.put("'");
    }
    lines.put(atom);
    is_quoted = is_quoted != is_mark;
  }
  return lines.ended();
}

}  // namespace vvstat
