#include "vv/secret.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "common/utf8.h"
#include "vv/terminal.h"

namespace vv {
namespace {

constexpr size_t kMost = 127;  // bytes that the tool takes of a user and of a password

// Reads the file up to a byte more than the longest password and its end of line.
bool read_password(const std::string& name, std::string& text) {
  const int file = name == "-" ? STDIN_FILENO : open(name.c_str(), O_RDONLY | O_CLOEXEC);
  if (file < 0) return false;
  text.reserve(kMost + 2);  // so that no copy of it stays elsewhere
  char byte = '\0';
  ssize_t size = 0;
  while (text.size() < kMost + 2 && (size = read(file, &byte, 1)) == 1) text += byte;
  if (file != STDIN_FILENO) close(file);
  if (text.ends_with('\n')) text.pop_back();
  return size >= 0;
}

// What is wrong with the text as a password; null when nothing is.
const char* fault_of(const std::string& secret) {
  if (secret.empty()) return "the password is empty";
  if (secret.size() > kMost) return "the password has more than 127 bytes";
  if (secret.find_first_of(std::string_view("\n\0", 2)) != std::string::npos) {
    return "the password has more than one line";
  }
  return nullptr;
}

}  // namespace

bool read_credentials(const Options& options, Credentials& credentials, std::string& why) {
  if (options.user.empty()) return true;
  credentials.user = options.user;
  const std::string& file = options.password_file;
  if (file.empty()) {
    why = "no password was typed; where there is no terminal, use --password-file";
    if (!ask_secret("Password of " + platform::printable(options.user) + ": ", credentials.secret)) {
      return false;
    }
  } else if (!read_password(file, credentials.secret)) {
    why = platform::printable(file) + ": " + strerror(errno);
    return false;
  }
  const char* fault =
      options.user.size() > kMost ? "the user's name has more than 127 bytes" : fault_of(credentials.secret);
  why = fault != nullptr ? fault : "";
  return fault == nullptr;
}

}  // namespace vv
