#include "ktree/element_text.h"

#include <algorithm>

#include "ktree/base64.h"
#include "ktree/limits.h"
#include "ktree/xml_text.h"

namespace ktree {
namespace {

constexpr size_t kMaxEncodedBytes = (kMaxValueBytes + 2) / 3 * 4;
constexpr char kTooLong[] = "a value of more than 65535 bytes";

std::string_view without_leading_blanks(std::string_view text) {
  return text.substr(std::min(text.find_first_not_of(kXmlBlanks), text.size()));
}

}  // namespace

bool ElementText::add_encoded(std::string_view piece) {
  for (char c : piece) {
    if (kXmlBlanks.find(c) == std::string_view::npos) text_ += c;
  }
  return text_.size() <= kMaxEncodedBytes;
}

bool ElementText::add(std::string_view piece) {
  if (encoded_) return add_encoded(piece);
  if (has_children_ && text_.empty()) piece = without_leading_blanks(piece);
  std::string_view kept = cut_ ? std::string_view() : piece.substr(0, kMaxValueBytes - text_.size());
  std::string_view rest = piece.substr(kept.size());
  text_ += kept;
  cut_ = cut_ || !rest.empty();
  return trim_blanks(rest).empty();
}

void ElementText::begin_child() {
  if (!has_children_) {
    has_children_ = true;
    text_ = without_leading_blanks(text_);
    cut_ = cut_ && !text_.empty();
  }
}

const char* ElementText::finish(std::string& value, bool& present) {
  if (encoded_) {
    present = true;
    if (!decode_base64(text_, value)) return "text that is not base64";
    if (value.find('\0') != std::string::npos) return "a value with a NUL byte";
    return value.size() > kMaxValueBytes ? kTooLong : nullptr;
  }
  std::string_view kept = trim_blanks(text_);
  present = !has_children_ || !kept.empty();
  if (kept.empty() || has_children_) {
    value = kept;
    return nullptr;
  }
  value = text_;
  return cut_ ? kTooLong : nullptr;
}

}  // namespace ktree
