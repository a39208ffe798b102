#include "volume/format_progress.h"

#include <cstring>

#include "support/text.h"
#include "sysaux.h"

namespace remvol {

namespace {

constexpr int kBackspace = '\b';
constexpr char kBackspaces[] = "\b";

// Cuts `text` at its last backspace and drops the backspaces before it. Returns whether there was one.
bool drop_last_redraw(char* text) {
  char* last = strrchr(text, kBackspace);
  if (last == nullptr) return false;
  *last = '\0';
  strrtrim(text, kBackspaces);
  return true;
}

// Returns the counter before the last redraw, inside `text`, or null when the read carries none.
char* find_counter(char* text) {
  if (!drop_last_redraw(text) || !drop_last_redraw(text)) return nullptr;
  char* last = strrchr(text, kBackspace);
  return last != nullptr ? strtrim(last + 1, kBackspaces) : nullptr;
}

// Gives numerator * scale / denominator + base. Returns false when that fits no number.
bool scale_counter(long long numerator, long long denominator, int scale, int base, int* percent) {
  long long scaled;
  int result;
  if (__builtin_mul_overflow(numerator, scale, &scaled)) return false;
  if (__builtin_add_overflow(scaled / denominator, base, &result)) return false;
  *percent = result;
  return true;
}

}  // namespace

bool update_format_progress(FormatProgress* progress, const char* text) {
  if (strstr(text, "Allocating group tables") != nullptr) progress->groups_seen = true;
  if (strstr(text, "Writing inode tables") != nullptr) progress->inodes_seen = true;
  char copy[kFormatReadSize];
  copy_text(copy, text);
  char* counter = find_counter(copy);
  char* slash = counter != nullptr ? strchr(counter, '/') : nullptr;
  if (slash == nullptr) return false;
  *slash = '\0';
  const long long numerator = str2ll(counter);
  const long long denominator = str2ll(slash + 1);
  if (denominator == 0) return false;
  if (progress->inodes_seen) return scale_counter(numerator, denominator, 70, 30, &progress->percent);
  if (progress->groups_seen) return scale_counter(numerator, denominator, 20, 10, &progress->percent);
  return true;
}

}  // namespace remvol
