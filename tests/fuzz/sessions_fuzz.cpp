// The sessions in sysfs, on any names and texts: those that have a target's name are listed as sysfs
// describes them, in its order, and no others.
#include <dirent.h>
#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <map>
#include <string>
#include <vector>

#include "common/sessions.h"
#include "require.h"

using platform::Link;
using platform::Session;

namespace {

const std::string kFolder = "/sys/class/iscsi_session";
constexpr size_t kRead = 512;  // of a file
constexpr size_t kMost = 8;    // sessions

using Names = std::vector<std::string>;
std::map<std::string, Names> folders;
std::map<std::string, std::string> files;

// Folders that are being listed, one while the other is.
struct Listing {
  const Names* names;
  size_t next;
  dirent entry;
};
Listing listings[2];
int listed = 0;

// Cuts off what stands before the first `end`.
std::string take(std::string& rest, char end) {
  const std::string part = rest.substr(0, rest.find(end));
  rest.erase(0, part.size() + 1);
  return part;
}

Names take_names(std::string text) {
  Names names;
  while (!text.empty() && names.size() < kMost)
    names.push_back(take(text, '/').substr(0, sizeof dirent::d_name - 1));
  return names;
}

// Between null characters: the names of the sessions, and for each its target's name, its state and the names
// of its devices. Names have slashes between them.
void make_sysfs(std::string input) {
  folders.clear();
  files.clear();
  folders[kFolder] = take_names(take(input, '\0'));
  for (const std::string& name : folders[kFolder]) {
    const std::string path = kFolder + "/" + name;
    files[path + "/targetname"] = take(input, '\0');
    files[path + "/state"] = take(input, '\0');
    folders[path + "/device"] = take_names(take(input, '\0'));
  }
}

std::string line_in(const std::string& path) {
  return files[path].substr(0, std::min(files[path].find('\n'), kRead));
}

Listing* listing_of(DIR* folder) {
  for (Listing& listing : listings) {
    if (folder == reinterpret_cast<DIR*>(&listing)) return &listing;
  }
  return nullptr;
}

bool has_name_with(const Names& names, const char* start) {
  for (const std::string& name : names) {
    if (name.starts_with(start)) return true;
  }
  return false;
}

// Whether the text is a number as the kernel writes those of sessions.
bool is_kernels_number(const std::string& text) {
  return !text.empty() && text.size() < 10 && text.find_first_not_of("0123456789") == std::string::npos &&
         (text[0] != '0' || text == "0");
}

void check(const std::string& name, const Session& session) {
  const std::string path = kFolder + "/" + name;
  require(session.target == line_in(path + "/targetname") && session.state == line_in(path + "/state"));
  const bool had_luns = has_name_with(folders[path + "/device"], "target");
  require(session.link == (session.state == "LOGGED_IN" ? Link::kUp : had_luns ? Link::kDown : Link::kNew));
  const std::string number = name.substr(strlen("session"));
  if (!is_kernels_number(number)) return;
  require(std::to_string(session.number) == number);
  files["/sys/class/iscsi_connection/connection" + number + ":0/persistent_address"] = session.target + "\n-";
  require(platform::address_of(session) == session.target);
}

}  // namespace

extern "C" {

DIR* __real_opendir(const char* path);
dirent* __real_readdir(DIR* folder);
int __real_closedir(DIR* folder);

int __wrap_open(const char* path, int, ...) {
  static const int file = memfd_create("file", MFD_CLOEXEC);
  const std::string& text = files[path];
  require(ftruncate(file, 0) == 0 && lseek(file, 0, SEEK_SET) == 0);
  require(pwrite(file, text.data(), text.size(), 0) == static_cast<ssize_t>(text.size()));
  return dup(file);
}

// Folders that are not in sysfs are the fuzzer's.
DIR* __wrap_opendir(const char* path) {
  if (strncmp(path, "/sys/", 5) != 0) return __real_opendir(path);
  require(listed < 2);
  listings[listed] = {&folders[path], 0, {}};
  return reinterpret_cast<DIR*>(&listings[listed++]);
}

dirent* __wrap_readdir(DIR* folder) {
  Listing* listing = listing_of(folder);
  if (listing == nullptr) return __real_readdir(folder);
  if (listing->next == listing->names->size()) return nullptr;
  strcpy(listing->entry.d_name, (*listing->names)[listing->next++].c_str());
  return &listing->entry;
}

int __wrap_closedir(DIR* folder) {
  if (listing_of(folder) == nullptr) return __real_closedir(folder);
  listed--;
  return 0;
}

}  // extern "C"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  make_sysfs(std::string(reinterpret_cast<const char*>(data), size));
  Names expected;
  for (const std::string& name : folders[kFolder]) {
    if (name.starts_with("session") && !line_in(kFolder + "/" + name + "/targetname").empty())
      expected.push_back(name);
  }
  require(platform::is_any_session() == has_name_with(folders[kFolder], "session"));
  const std::vector<Session> sessions = platform::read_sessions();
  require(sessions.size() == expected.size());
  for (size_t i = 0; i < sessions.size(); i++) check(expected[i], sessions[i]);
  return 0;
}
