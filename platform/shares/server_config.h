// What an administrator's configuration of a file server says, as far as generated shares care. smb.conf and
// afp.conf have the same form: "[section]" and "option = value".
#ifndef PLATFORM_SHARES_SERVER_CONFIG_H
#define PLATFORM_SHARES_SERVER_CONFIG_H

#include <string>
#include <string_view>
#include <vector>

namespace shares {

struct ServerConfig {
  bool includes_shares = false;     // it includes the generated file
  bool sets_vfs_objects = false;    // it sets Samba's "vfs objects" for all shares
  std::vector<std::wstring> names;  // its own shares, folded
};

// Reads the text of a configuration; `generated` is the file of generated shares. Other files that it
// includes are not followed.
ServerConfig parse_server_config(std::string_view text, std::string_view generated);

}  // namespace shares

#endif
