#include "iscsi/iscsid.h"

#include "support/shell_text.h"

namespace remvol {

namespace {

constexpr char kNameFile[] = "/etc/iscsi/initiatorname.iscsi";

}  // namespace

CommandText start_iscsid_command() {
  return CommandText("iscsid -f >/dev/null 2>&1 &");
}

CommandText end_iscsid_command() {
  return CommandText("killall -SIGTERM iscsid");
}

CommandText end_iscsid_quietly_command() {
  return CommandText("killall -q -SIGTERM iscsid");
}

CommandText configure_iscsid_command(const char* settings) {
  return CommandText("echo -e \"%s\" > %s", settings, kIscsidConf);
}

CommandText name_initiator_command(const char* name) {
  return shell_command("echo 'InitiatorName=%s' > %s", name, kNameFile);
}

}  // namespace remvol
