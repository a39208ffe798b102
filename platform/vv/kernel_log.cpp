#include "vv/kernel_log.h"

#include <fcntl.h>
#include <unistd.h>

#include <cctype>
#include <cerrno>

#include "common/utf8.h"

namespace vv {
namespace {

constexpr size_t kMost = 3;

bool ends_name(std::string_view text, size_t at) {
  while (at < text.size() && isdigit(static_cast<unsigned char>(text[at])) != 0) at++;
  return at == text.size() || isalnum(static_cast<unsigned char>(text[at])) == 0;
}

}  // namespace

std::string message_of(std::string_view record) {
  const size_t semicolon = record.find(';');
  if (semicolon == std::string_view::npos) return {};
  const std::string_view text = record.substr(semicolon + 1);
  return platform::printable(text.substr(0, text.find('\n')));
}

bool tells_of(std::string_view message, std::string_view disk) {
  if (disk.empty()) return false;
  for (size_t at = 0; (at = message.find(disk, at)) != std::string_view::npos; at += disk.size()) {
    const bool begins = at == 0 || isalnum(static_cast<unsigned char>(message[at - 1])) == 0;
    if (begins && ends_name(message, at + disk.size())) return true;
  }
  return false;
}

KernelLog::KernelLog() : file_(open("/dev/kmsg", O_RDONLY | O_NONBLOCK | O_CLOEXEC)) {
  if (file_ >= 0) lseek(file_, 0, SEEK_END);
}

KernelLog::~KernelLog() {
  if (file_ >= 0) close(file_);
}

std::vector<std::string> KernelLog::messages_of(const std::string& disk) {
  std::vector<std::string> messages;
  char record[8192];
  while (file_ >= 0) {
    const ssize_t size = read(file_, record, sizeof record);
    if (size < 0 && errno == EPIPE) continue;  // older ones were overwritten
    if (size <= 0) break;
    const std::string message = message_of({record, static_cast<size_t>(size)});
    if (!tells_of(message, disk)) continue;
    messages.push_back(message);
    if (messages.size() > kMost) messages.erase(messages.begin());
  }
  return messages;
}

}  // namespace vv
