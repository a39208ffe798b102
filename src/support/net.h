// Portal addresses: their form.
#ifndef REMVOL_SUPPORT_NET_H
#define REMVOL_SUPPORT_NET_H

#include <cstddef>

#include "support/text.h"

namespace remvol {

using AddressText = Text<256>;

// Returns the text between "[" and "]", or all of it without brackets.
[[nodiscard]] AddressText without_brackets(const char* address);

// Returns non-zero when `text` is not empty and contains a colon.
[[nodiscard]] int is_ipv6_text(const char* text);

// Converts IPv6 text to 16 bytes in network byte order, without validation. Returns 0, or -1 for a null text,
// one shorter than 3 characters, or a buffer below 16 bytes.
[[nodiscard]] int parse_ipv6_text(unsigned char* address, size_t size, const char* text);

// Returns 1 when `address`, with or without square brackets, is link-local (fe80::/10 with bytes 2 to 7
// zero), 0 when not, -1 on a bad argument.
[[nodiscard]] int is_ipv6_link_local(const char* address);

}  // namespace remvol

#endif
