#include "json.h"

#include <cstdio>
#include <string_view>

#include "utf8.h"

namespace vvstat {
namespace {

// The states of the tree in words, by their numbers.
constexpr const char* kConnectStates[] = {"disconnected", "connected", "connecting", "recovering", "error"};
constexpr const char* kFormatStates[] = {"none", "running", nullptr, "failed", "waiting"};
constexpr const char* kVolumeStates[] = {"ready", "creating", "offline", "failed", nullptr, "unsupported"};

template <size_t N>
std::string_view word(const char* const (&words)[N], int state) {
  const auto index = static_cast<size_t>(state);
  return state >= 0 && index < N && words[index] != nullptr ? words[index] : "unknown";
}

std::string quoted(std::string_view text) {
  std::wstring characters;
  const std::string valid =
      platform::decode(text, characters) ? std::string(text) : platform::printable(text);
  std::string out = "\"";
  for (const char byte : valid) {
    char escaped[8] = {byte};
    if (byte == '"' || byte == '\\') {
      snprintf(escaped, sizeof escaped, "\\%c", byte);
    } else if ((byte >= 0 && byte < 0x20) || byte == 0x7f) {
      snprintf(escaped, sizeof escaped, "\\u%04x", static_cast<unsigned>(byte));
    }
    out += escaped;
  }
  return out += '"';
}

std::string flag(bool yes) {
  return yes ? "true" : "false";
}

class Object {
 public:
  Object& add(const char* name, const std::string& value) {
    text_ += text_.empty() ? "{" : ",";
    text_ += quoted(name);
    text_ += ":";
    text_ += value;
    return *this;
  }
  std::string text() { return text_ += "}"; }

 private:
  std::string text_;
};

template <typename Record>
std::string list(const std::vector<Record>& records, std::string (*text_of)(const Record&)) {
  std::string text = "[";
  for (const Record& record : records) {
    text += text.size() > 1 ? "," : "";
    text += text_of(record);
  }
  return text += "]";
}

std::string volume_text(const Volume& volume) {
  return Object()
      .add("lun", std::to_string(volume.lun))
      .add("share", quoted(volume.share))
      .add("status", quoted(volume.status))
      .add("enabled", flag(volume.enabled))
      .add("read_only", flag(volume.read_only))
      .add("volume_state", quoted(word(kVolumeStates, volume.volume_state)))
      .add("format_state", quoted(word(kFormatStates, volume.format_state)))
      .add("format_progress", std::to_string(volume.progress))
      .add("used_bytes", std::to_string(volume.used))
      .add("size_bytes", std::to_string(volume.size))
      .add("file_system", quoted(volume.file_system))
      .add("device", quoted(volume.device))
      .add("mount_point", quoted(volume.mount_point))
      .text();
}

std::string target_text(const Target& target) {
  return Object()
      .add("name", quoted(target.name))
      .add("address", quoted(target.address))
      .add("port", std::to_string(target.port))
      .add("wanted", flag(target.wanted))
      .add("connected", flag(is_connected(target)))
      .add("connect_state", quoted(word(kConnectStates, target.connect_state)))
      .add("status", quoted(target.status))
      .add("volumes", list(target.volumes, volume_text))
      .text();
}

}  // namespace

std::string json(const Status& status) {
  return Object()
             .add("version", std::to_string(kJsonVersion))
             .add("reachable", flag(status.reachable))
             .add("all_connected", flag(status.reachable && all_connected(status)))
             .add("targets", list(status.targets, target_text))
             .text() +
         "\n";
}

}  // namespace vvstat
