#include "iscsi/iscsid.h"

#include "support/shell_text.h"

namespace remvol {

namespace {

constexpr char kNameFile[] = "/etc/iscsi/initiatorname.iscsi";

}  // namespace

CommandText configure_iscsid_command(const char* settings) {
  return CommandText("echo -e \"%s\" > %s", settings, kIscsidConf);
}

CommandText name_initiator_command(const char* name) {
  return shell_command("echo 'InitiatorName=%s' > %s", name, kNameFile);
}

}  // namespace remvol
