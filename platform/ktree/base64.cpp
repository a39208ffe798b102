#include "ktree/base64.h"

namespace ktree {
namespace {

constexpr unsigned kNoDigit = 64;

unsigned digit_value(char c) {
  if (c >= 'A' && c <= 'Z') return static_cast<unsigned>(c - 'A');
  if (c >= 'a' && c <= 'z') return static_cast<unsigned>(c - 'a') + 26;
  if (c >= '0' && c <= '9') return static_cast<unsigned>(c - '0') + 52;
  if (c == '+') return 62;
  return c == '/' ? 63 : kNoDigit;
}

// Decodes the 2 to 4 characters of a quantum, its padding left off, into one byte less.
bool decode_quantum(std::string_view quantum, std::string& bytes) {
  unsigned bits = 0;
  for (char c : quantum) {
    unsigned value = digit_value(c);
    if (value == kNoDigit) return false;
    bits = bits << 6 | value;
  }
  const auto unused = static_cast<unsigned>(quantum.size() * 6 - (quantum.size() - 1) * 8);
  if ((bits & ((1U << unused) - 1)) != 0) return false;
  bits >>= unused;
  for (size_t left = quantum.size() - 1; left > 0; left--) {
    bytes.push_back(static_cast<char>(bits >> (8 * (left - 1)) & 255U));
  }
  return true;
}

}  // namespace

bool decode_base64(std::string_view text, std::string& bytes) {
  bytes.clear();
  if (text.size() % 4 != 0) return false;
  for (size_t i = 0; i < text.size(); i += 4) {
    std::string_view quantum = text.substr(i, 4);
    if (i + 4 == text.size()) {
      size_t padding = quantum.ends_with("==") ? 2 : quantum.ends_with('=') ? 1 : 0;
      quantum.remove_suffix(padding);
    }
    if (!decode_quantum(quantum, bytes)) return false;
  }
  return true;
}

}  // namespace ktree
