// What an administrator's configuration of a file server says, as far as generated shares care. smb.conf and
// afp.conf have the same form: "[section]" and "option = value", a backslash before the end of a line joins
// the next one to it.
#ifndef PLATFORM_SHARES_SERVER_CONFIG_H
#define PLATFORM_SHARES_SERVER_CONFIG_H

#include <string>
#include <string_view>
#include <vector>

namespace shares {

struct Include {
  std::string file;
  bool global;  // it stands among the options for all shares
};

struct ServerConfig {
  bool includes_shares = false;     // it includes the generated file
  bool sets_vfs_objects = false;    // it sets Samba's "vfs objects" for all shares
  bool uses_registry = false;       // Samba has shares in its registry as well
  std::vector<std::wstring> names;  // its own shares, folded
  std::vector<Include> includes;    // files that are read in addition
};

// `text` without the white space at its ends.
std::string_view trim(std::string_view text);

// Adds what the text of one file says to `config`; `global` tells whether it begins among the options for all
// shares. An include with a substitution (%m) differs from client to client and is left out.
void parse_server_config(std::string_view text, bool global, ServerConfig& config);

// Reads `file` and every file that it includes, and so on; what is missing or no file is passed over.
// `generated` is the file of generated shares: it is not read, whatever the path that leads to it.
ServerConfig read_server_config(const char* file, const char* generated);

}  // namespace shares

#endif
