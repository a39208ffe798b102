// The settings file on disk, on any text, beside a tree that was never loaded: it is whole when it ends so,
// and a dump is withheld for it only when it can hold settings. An own file, with any text between its
// elements, always is.
#include "tree/settings_file.h"

#include <string>
#include <string_view>

#include "frontend/log.h"
#include "hostile_tree.h"
#include "require.h"
#include "tree_layout.h"
#include "wrapped_files.h"

using namespace remvol;

namespace {

constexpr std::string_view kEnd = "</config>";
constexpr size_t kLooked = 64;  // bytes at its end

bool ends_as_settings_do(std::string_view text) {
  if (text.size() > kLooked) text.remove_prefix(text.size() - kLooked);
  while (!text.empty() && std::string_view(" \t\r\n").find(text.back()) != std::string_view::npos) {
    text.remove_suffix(1);
  }
  return text.ends_with(kEnd);
}

void check_own_file(const std::string& between) {
  std::string text;
  for (const char* tag : {"<config>", "<iscsi>", "<initiator>", "<ver>1</ver>", "</initiator>"})
    text += between + tag;
  give_file(text);
  require(unloaded_settings() == kSettingsFile);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  debug_level = -1;
  if (size == 0) return 0;  // no file
  values.assign(1, "-");
  const std::string text(reinterpret_cast<const char*>(data), size);
  give_file(text);
  require(!settings_file_is_unreadable(kSettingsFile));
  require(settings_file_is_torn(kSettingsFile) != ends_as_settings_do(text));
  const char* file = unloaded_settings();
  if (text.find("<ver") == std::string::npos && text.find("<count") == std::string::npos)
    require(file == nullptr);
  require(file == nullptr || file == kSettingsFile);
  values.assign(1, "1");  // one that was loaded
  require(unloaded_settings() == nullptr);
  values.assign(1, "-");
  if (text.find_first_of("<>") == std::string::npos) check_own_file(text);
  return 0;
}
