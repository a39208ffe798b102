// Base64 as RFC 4648, section 4, writes it: with padding, without line breaks.
#ifndef PLATFORM_KTREE_BASE64_H
#define PLATFORM_KTREE_BASE64_H

#include <string>
#include <string_view>

namespace ktree {

// Calls put(char) for every character of the encoded `bytes`.
template <typename Put>
void encode_base64(std::string_view bytes, Put put) {
  constexpr char kDigits[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
  for (size_t i = 0; i < bytes.size(); i += 3) {
    unsigned triple = 0;
    size_t have = bytes.size() - i < 3 ? bytes.size() - i : 3;
    for (size_t k = 0; k < 3; k++) {
      triple = triple << 8 | (k < have ? static_cast<unsigned char>(bytes[i + k]) : 0U);
    }
    for (size_t k = 0; k < 4; k++) put(k <= have ? kDigits[triple >> (18 - 6 * k) & 63U] : '=');
  }
}

// Decodes `text` (no white space in it) into `bytes`. Returns false when it is not base64 or carries bits
// that no encoder writes.
[[nodiscard]] bool decode_base64(std::string_view text, std::string& bytes);

}  // namespace ktree

#endif
