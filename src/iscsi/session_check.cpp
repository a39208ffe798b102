#include "iscsi/session_check.h"

#include <cstdlib>

#include "frontend/log.h"
#include "iscsi/iscsiadm.h"
#include "iscsi/session_listing.h"
#include "support/command.h"
#include "support/files.h"
#include "support/program.h"
#include "support/result.h"
#include "support/temp_file.h"
#include "support/text.h"

namespace remvol {

int list_sessions(const char* command) {
  const int status = system(command);
  if (status == 0) return kSessionsListed;
  if (command_exit_code(status) == kNoSessionExit) return kNoSessionAtAll;
  LOG(0, "system() of cmd '%s' failed", command);
  log_command_status(status);
  return kListingFailed;
}

int check_target_connected(const char* name) {
  const LogScope scope;
  if (name == nullptr || name[0] == '\0') return kFailed;
  const TempFile path(PathText("/tmp/%s_session.tmp", program_name()));
  const int listed = list_sessions(sessions_command(path));
  if (listed != kSessionsListed) return listed < 0 ? listed : kNotLoggedIn;
  File file(fopen(path, "re"));
  if (file == nullptr) return kNotLoggedIn;
  char line[kListingLineSize];
  bool connected = false;
  while (!connected && fgets(line, sizeof line, file.get()) != nullptr) {
    connected = session_line_shows(line, name);
  }
  file.reset();
  (void)_remove_file(path);
  return connected ? kLoggedIn : kNotLoggedIn;
}

}  // namespace remvol
