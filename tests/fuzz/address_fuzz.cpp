// Addresses, on any text: what inet_pton(3) takes for an IPv6 address is read as it reads it, with or without
// brackets around it.
#include <arpa/inet.h>

#include <cstdint>
#include <string>

#include "require.h"
#include "support/net.h"

using namespace remvol;

namespace {

bool is_link_local(const in6_addr& address) {
  static constexpr unsigned char kZero[6] = {};
  return address.s6_addr[0] == 0xfe && (address.s6_addr[1] & 0xc0) == 0x80 &&
         memcmp(address.s6_addr + 2, kZero, sizeof kZero) == 0;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string text(reinterpret_cast<const char*>(data),
                         strnlen(reinterpret_cast<const char*>(data), size));
  unsigned char bytes[16 + 4];
  memset(bytes, 'x', sizeof bytes);
  const int result = parse_ipv6_text(bytes, 16, text.c_str());
  require(result == (text.size() < 3 ? -1 : 0));
  for (size_t i = 16; i < sizeof bytes; i++) require(bytes[i] == 'x');
  const int local = is_ipv6_link_local(text.c_str());
  require(local >= -1 && local <= 1);
  in6_addr address{};
  // Two points are no groups, and an address with a dotted end is none of a portal.
  const bool plain = text.size() >= 3 && text.find('.') == std::string::npos;
  if (!plain || inet_pton(AF_INET6, text.c_str(), &address) != 1) return 0;
  require(memcmp(bytes, &address, 16) == 0);
  require(is_ipv6_text(text.c_str()) != 0);
  require(local == (is_link_local(address) ? 1 : 0));
  require(is_ipv6_link_local(("[" + text + "]").c_str()) == local);
  return 0;
}
