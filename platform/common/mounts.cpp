#include "common/mounts.h"

#include <fcntl.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <algorithm>
#include <charconv>

#include "common/file_text.h"

namespace platform {
namespace {

// Takes what stands before the next separator, and the separator.
std::string_view take_word(std::string_view& text, char separator) {
  const std::string_view word = text.substr(0, text.find(separator));
  text.remove_prefix(std::min(word.size() + 1, text.size()));
  return word;
}

bool is_octal(char digit) {
  return digit >= '0' && digit <= '7';
}

// Blanks, newlines and backslashes are "\040" there.
std::string unescaped(std::string_view word) {
  if (word.find('\\') == std::string_view::npos) return std::string(word);
  std::string text;
  while (!word.empty()) {
    const bool escaped =
        word.size() >= 4 && word[0] == '\\' && std::all_of(word.begin() + 1, word.begin() + 4, is_octal);
    text +=
        escaped ? static_cast<char>((word[1] - '0') * 64 + (word[2] - '0') * 8 + (word[3] - '0')) : word[0];
    word.remove_prefix(escaped ? 4 : 1);
  }
  return text;
}

bool is_among(std::string_view list, std::string_view option) {
  while (!list.empty()) {
    if (take_word(list, ',') == option) return true;
  }
  return false;
}

// Either may be read-only; what both say stands there once.
std::string joined(std::string_view mount, std::string_view file_system) {
  std::string all = is_among(mount, "ro") || is_among(file_system, "ro") ? "ro" : "rw";
  for (std::string_view list : {mount, file_system}) {
    while (!list.empty()) {
      const std::string_view option = take_word(list, ',');
      if (option != "rw" && option != "ro" && !is_among(all, option)) all.append(",").append(option);
    }
  }
  return all;
}

// "98:0".
bool read_device(std::string_view text, dev_t& device) {
  const std::string_view first = take_word(text, ':');
  unsigned major = 0, minor = 0;
  if (std::from_chars(first.begin(), first.end(), major).ec != std::errc() ||
      std::from_chars(text.begin(), text.end(), minor).ec != std::errc()) {
    return false;
  }
  device = makedev(major, minor);
  return true;
}

// "36 35 98:0 /mnt1 /mnt2 rw,noatime master:1 - ext3 /dev/root rw,errors=continue": proc_pid_mountinfo(5).
bool read_mount(std::string_view line, Mount& mount) {
  const size_t separator = line.find(" - ");
  if (separator == std::string_view::npos) return false;
  std::string_view first = line.substr(0, separator), second = line.substr(separator + 3);
  for (int word = 0; word < 2; word++) take_word(first, ' ');
  if (!read_device(take_word(first, ' '), mount.device)) return false;
  take_word(first, ' ');
  mount.point = unescaped(take_word(first, ' '));
  for (int word = 0; word < 2; word++) take_word(second, ' ');
  mount.options = joined(take_word(first, ' '), second);
  return !mount.point.empty();
}

}  // namespace

std::vector<Mount> mounts_of(std::string_view text) {
  std::vector<Mount> mounts;
  while (!text.empty()) {
    Mount mount;
    if (read_mount(take_word(text, '\n'), mount)) mounts.push_back(std::move(mount));
  }
  return mounts;
}

std::vector<Mount> read_mounts() {
  const int file = open("/proc/self/mountinfo", O_RDONLY | O_CLOEXEC);
  if (file < 0) return {};
  std::vector<Mount> mounts = mounts_of(content_of(file));
  close(file);
  return mounts;
}

const Mount* mount_on(const std::vector<Mount>& mounts, std::string_view point) {
  const auto found = std::find_if(mounts.rbegin(), mounts.rend(),
                                  [point](const Mount& mount) { return mount.point == point; });
  return found == mounts.rend() ? nullptr : &*found;
}

}  // namespace platform
