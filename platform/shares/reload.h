// The work of a share reload: the mounted volumes of the tree become the sections of a generated file.
#ifndef PLATFORM_SHARES_RELOAD_H
#define PLATFORM_SHARES_RELOAD_H

#include <string>
#include <vector>

#include "shares/share_file.h"
#include "shares/share_name.h"

namespace shares {

// A file server, as a reload sees it.
struct ShareServer {
  const char* reload;  // name of the reload program
  const char* file;    // the generated file
  const NameRules& names;
  std::vector<std::wstring> taken;  // folded names of shares that are not ours
  bool takes_blanks;                // its lists of users may hold names with blanks
  std::string attribute_options;    // lines for volumes whose file system keeps user attributes
  bool withdraw;                    // no volume is to be shared, whatever the tree says
};

// What the command line of a reload program asks for.
enum class ReloadCommand { kReload, kWithdraw, kWrong };

// Reads the command line; prints the usage when it is wrong.
ReloadCommand read_command(int argc, char** argv);

struct Reload {
  bool has_tree;  // false: the tree was asked, and the shares are those that are still mounted
  bool untold;    // the server is to be told of a change: of this one, or of one that it was not told of
  std::vector<Section> shares;       // what the generated file is to hold now
  std::vector<std::string> cut_off;  // shares that it held and that are gone, or whose users have changed
};

inline constexpr char kAccessFile[] = "/etc/remvol/shares.conf";

// Brings the generated file up to date. While the file that says who may use a share is wrong, of which a
// line in the log tells, shares stay as they are as long as they are mounted, and no new one comes. A volume
// that failed or whose name the server cannot use is left out with a line in the log, and so is a change that
// cannot be written. A mark beside the file keeps what is untold until remember_told().
Reload reload_shares(const ShareServer& server);

// The server knows the shares, or will read them when it starts. Clients of the shares named are still to be
// cut off, whatever has become of these shares since.
void remember_told(const char* file, const std::vector<std::string>& left);

}  // namespace shares

#endif
