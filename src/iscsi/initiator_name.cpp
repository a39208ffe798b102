#include "iscsi/initiator_name.h"

#include <cctype>
#include <cstring>

#include "frontend/log.h"
#include "support/lan.h"
#include "support/result.h"
#include "sysaux.h"
#include "tree/access.h"
#include "tree_layout.h"

namespace remvol {

namespace {

constexpr char kDefaultPrefix[] = "iqn.2013-03.org.example:";
constexpr size_t kMacTextLength = 17;  // 00:90:A9:1B:2C:3D
constexpr size_t kLastOctets = 9;      // where the last three begin in it
constexpr size_t kUniqueNameLength = 6;

// Puts the letters and digits of `octets` into `name`, lower-cased and without the colons between them.
// Returns false at any other character.
bool read_octets(const char* octets, Text<16>* name) {
  size_t length = 0;
  for (; *octets != '\0'; octets++) {
    const unsigned char character = static_cast<unsigned char>(*octets);
    if (character == ':') continue;
    if (isalnum(character) == 0) return false;
    name->data()[length++] = static_cast<char>(tolower(character));
    name->data()[length] = '\0';
  }
  return true;
}

}  // namespace

InitiatorName make_initiator_name() {
  char prefix[256];
  LOG(1, "strNode: %s", key::kInitiatorPrefix);
  if (!tree_read(key::kInitiatorPrefix, prefix)) copy_text(prefix, kDefaultPrefix);
  char host[256] = "";
  const bool has_host = sys_hostname(host, sizeof host) == 0;
  if (has_host) str_to_lower(host);
  char unique_name[16] = "";
  const bool is_unique = get_mac_as_unique_name(unique_name) == 0;
  if (!is_unique) LOG(1, "get_mac_as_unique_name failed");
  return InitiatorName("%s%s%sinitiator%s%s", prefix, has_host ? host : "", has_host ? ":" : "",
                       is_unique ? "-" : "", is_unique ? unique_name : "");
}

int get_mac_as_unique_name(char* out) {
  const LogScope scope;
  char mac[32] = "";
  if (get_lan0_mac_text(mac) != 0) {
    LOG(kNote, "ERROR : get lan1 mac from ktree failed");
    return kFailed;
  }
  LOG(2, "LAN1 mac = %s", mac);
  int result = kOk;
  if (out != nullptr && strlen(mac) == kMacTextLength) {
    Text<16> name;
    if (!read_octets(mac + kLastOctets, &name)) result = kFailed;
    snprintf(out, kUniqueNameLength + 1, "%.*s", static_cast<int>(kUniqueNameLength), name.c_str());
    if (strlen(name) != kUniqueNameLength) {
      LOG(0, "error : unique_name = %s", name.c_str());
      result = kFailed;
    }
  }
  LOG(2, "unique_name = %s", out != nullptr ? out : "");
  return result;
}

void str_to_lower(char* text) {
  for (; *text != '\0'; text++) *text = static_cast<char>(tolower(static_cast<unsigned char>(*text)));
}

}  // namespace remvol
