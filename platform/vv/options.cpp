#include "vv/options.h"

#include <algorithm>
#include <iterator>

namespace vv {
namespace {

constexpr OptionRow kOptions[] = {
    {kPortalOption, kPortal, "portal", "ADDRESS[:PORT]",
     "of the storage server; port 3260 when none is given"},
    {kTargetOption, kTarget, "target", "TARGET", "when the portal offers several"},
    {kLunOption, kLun, "lun", "NUMBER", "of the LUN on the target"},
    {kUserOption, kUser, "user", "NAME", "the target asks for a user and a password"},
    {kPasswordFileOption, kUser, "password-file", "FILE",
     "the password is its only line; - is standard input;\n"
     "                           without this option it is asked for at the terminal"},
    {kPasswordOption, 0, "password", "TEXT", nullptr},  // so that it is no short form of the one before it
    {kNoPasswordOption, kNoPassword, "no-password", nullptr, "the target asks for none any more"},
    {kDestroyDataOption, kDestroyData, "destroy-data", nullptr, "a format may overwrite what is on the disk"},
    {kYesOption, kYes, "yes", nullptr, "asks no questions"},
    {kJsonOption, 0, "json", nullptr, "JSON, for programs"},
    {'h', 0, "help", nullptr, "this text"},
    {'V', 0, "version", nullptr, "the version"},
};

}  // namespace

std::span<const OptionRow> option_rows() {
  return kOptions;
}

bool takes(const Command& command, const OptionRow& row) {
  return row.bit == 0 || (command.takes & row.bit) != 0;
}

std::vector<std::string> options_of(const Command& command) {
  std::vector<std::string> names;
  for (const OptionRow& row : kOptions) {
    if (row.help != nullptr && takes(command, row)) names.push_back(std::string("--") + row.name);
  }
  return names;
}

bool takes_value(const std::string& option) {
  return std::any_of(std::begin(kOptions), std::end(kOptions), [&option](const OptionRow& row) {
    return row.argument != nullptr && option == std::string("--") + row.name;
  });
}

}  // namespace vv
