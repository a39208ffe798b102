#include "support/net.h"

#include <cstdlib>
#include <cstring>

namespace remvol {

namespace {

constexpr int kWords = 8;  // an IPv6 address is eight 16-bit words

int count_colons(const char* text) {
  int count = 0;
  for (; *text != '\0'; text++) count += *text == ':' ? 1 : 0;
  return count;
}

// Stores the group that begins at `group` as word `index`, most significant byte first. Addresses are not
// validated, so a surplus group is dropped.
void store_group(unsigned char* address, int index, const char* group) {
  if (index < 0 || index >= kWords) return;
  const long value = *group == ':' ? 0 : strtol(group, nullptr, 16);
  address[2 * index] = static_cast<unsigned char>(value >> 8);
  address[2 * index + 1] = static_cast<unsigned char>(value);
}

}  // namespace

AddressText without_brackets(const char* address) {
  const char* open = strchr(address, '[');
  if (open == nullptr) return AddressText("%s", address);
  const int length = static_cast<int>(strcspn(open + 1, "]"));
  return AddressText("%.*s", length, open + 1);
}

int is_ipv6_text(const char* text) {
  return text != nullptr && strchr(text, ':') != nullptr ? 1 : 0;
}

int parse_ipv6_text(unsigned char* address, size_t size, const char* text) {
  if (address == nullptr || text == nullptr || strlen(text) < 3 || size < 2 * kWords) return -1;
  memset(address, 0, size);
  unsigned char* const words = address + size - 2 * kWords;
  int index = 0;
  const char* group = text;
  while (const char* colon = strchr(group, ':')) {
    store_group(words, index++, group);
    group = colon + 1;
    if (*group == ':') {
      group++;
      index = kWords - 1 - count_colons(group);
    }
  }
  store_group(words, index, group);
  return 0;
}

int is_ipv6_link_local(const char* address) {
  if (address == nullptr) return -1;
  unsigned char bytes[16];
  if (parse_ipv6_text(bytes, sizeof bytes, Text<64>("%s", without_brackets(address).c_str())) != 0) return -1;
  static constexpr unsigned char kZero[6] = {};
  const bool link_local = bytes[0] == 0xfe && (bytes[1] & 0xc0) == 0x80 && memcmp(bytes + 2, kZero, 6) == 0;
  return link_local ? 1 : 0;
}

}  // namespace remvol
