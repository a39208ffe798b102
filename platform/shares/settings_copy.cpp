#include "shares/settings_copy.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "common/fd.h"
#include "common/lock_file.h"
#include "common/report.h"

namespace flash {
namespace {

constexpr char kPrefix[] = ".vv.xml.";  // of our temporary files, which a killed run may leave behind
constexpr char kNew[] = ".new";
constexpr char kKept[] = ".kept";
constexpr char kTurn[] = "flash.copy";
constexpr int kReading = O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC;
constexpr int kMaking = O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;

// Only one at a time writes temporary files, so that what is there at the start was left behind. The copy is
// made also when the lock cannot be had: the names are each process's own.
class Turn {
 public:
  Turn() : file_(platform::open_lock_file(kTurn)) {
    held_ = file_.ok() && platform::take_lock(file_.get(), LOCK_EX);
  }
  bool held() const { return held_; }

 private:
  platform::Fd file_;
  bool held_;
};

void make_name(char (&name)[64], const char* ending) {
  snprintf(name, sizeof name, "%s%ld%s", kPrefix, static_cast<long>(getpid()), ending);
}

// Copies all of `from` and writes it out.
bool copy_out(int from, int to) {
  char buffer[65536];
  for (off_t offset = 0;;) {
    const ssize_t n = pread(from, buffer, sizeof buffer, offset);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return false;
    if (n == 0) return fsync(to) == 0;
    if (!platform::write_all(to, buffer, static_cast<size_t>(n))) return false;
    offset += n;
  }
}

bool is_regular(int fd) {
  struct stat info = {};
  if (fd < 0 || fstat(fd, &info) != 0) return false;
  if (!S_ISREG(info.st_mode)) errno = EINVAL;
  return S_ISREG(info.st_mode);
}

// Returns whether the file ends as settings do.
bool is_whole(int fd) {
  constexpr char kEnd[] = "</config>";
  constexpr size_t kEndLength = sizeof kEnd - 1;
  char end[64];
  struct stat info = {};
  if (!is_regular(fd) || fstat(fd, &info) != 0) return false;
  const off_t from = info.st_size > off_t{sizeof end} ? info.st_size - off_t{sizeof end} : 0;
  ssize_t length = pread(fd, end, sizeof end, from);
  while (length > 0 && memchr(" \t\r\n", end[length - 1], 4) != nullptr) length--;
  return length >= ssize_t{kEndLength} && memcmp(end + length - kEndLength, kEnd, kEndLength) == 0;
}

// Gives `name` the name of the settings, and syncs that to the disk.
bool take_the_name(int folder, const char* name) {
  return renameat(folder, name, folder, kSettingsName) == 0 && fsync(folder) == 0;
}

// Ends the use of a kept copy. Returns false when the settings were torn; it has taken their place then.
bool end_keeping(int folder, const char* name) {
  const platform::Fd settings(openat(folder, kSettingsName, kReading));
  const bool torn = settings.ok() && !is_whole(settings.get());
  if (!torn) {
    if (settings.ok()) fsync(settings.get());
    fsync(folder);
    unlinkat(folder, name, 0);
    return true;
  }
  const bool put_back = take_the_name(folder, name);
  platform::report(LOG_WARNING, "flashrun: %s/%s was torn, %s", kFlashFolder, kSettingsName,
                   put_back ? "the former one is back" : strerror(errno));
  return false;
}

bool ends_with(const char* text, const char* ending) {
  const size_t length = strlen(text);
  const size_t wanted = strlen(ending);
  return length >= wanted && strcmp(text + length - wanted, ending) == 0;
}

void clear_one(int folder, const char* name) {
  if (strncmp(name, kPrefix, sizeof kPrefix - 1) != 0) return;
  if (ends_with(name, kNew)) unlinkat(folder, name, 0);
  if (!ends_with(name, kKept)) return;
  const platform::Fd kept(openat(folder, name, kReading));
  if (kept.ok() && flock(kept.get(), LOCK_EX | LOCK_NB) == 0) end_keeping(folder, name);
}

// Removes what killed runs left in the folder.
void clear_left_overs(int folder) {
  DIR* entries = fdopendir(openat(folder, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (entries == nullptr) return;
  while (const dirent* entry = readdir(entries)) clear_one(folder, entry->d_name);
  closedir(entries);
}

// Puts a copy of `from` in the place of the settings. Returns false, with errno; they are as they were then,
// unless the very last step failed, the writing of the folder to its disk.
bool replace_settings(int folder, int from) {
  char name[64];
  make_name(name, kNew);
  unlinkat(folder, name, 0);
  const platform::Fd to(openat(folder, name, kMaking, 0600));
  if (!to.ok()) return false;
  if (fchmod(to.get(), 0600) == 0 && copy_out(from, to.get()) && take_the_name(folder, name)) return true;
  const int error = errno;
  unlinkat(folder, name, 0);
  errno = error;
  return false;
}

constexpr int kMostWords = 5;  // one more than such a command has

// Parts a command line at its blanks, in place. Returns the number of words, 0 when the line holds anything
// that a shell would not take as it is.
int split_line(char* line, const char** words) {
  constexpr char kPlain[] = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789_./-+,:@% \t";
  if (line[strspn(line, kPlain)] != '\0') return 0;
  int count = 0;
  char* rest = nullptr;
  for (char* word = strtok_r(line, " \t", &rest); word != nullptr && count < kMostWords;) {
    words[count++] = word;
    word = strtok_r(nullptr, " \t", &rest);
  }
  return count;
}

bool is_settings_name(const char* path) {
  const char* slash = strrchr(path, '/');
  return strcmp(slash == nullptr ? path : slash + 1, kSettingsName) == 0;
}

// Returns whether "cp SOURCE TARGET" writes the settings in the folder.
bool leads_to_settings(const char* source, const char* target) {
  constexpr size_t kLength = sizeof kFlashFolder - 1;
  if (source[0] == '-' || strncmp(target, kFlashFolder, kLength) != 0) return false;
  const char* rest = target + kLength;
  if (strcmp(rest, "/vv.xml") == 0) return true;
  return (strcmp(rest, "") == 0 || strcmp(rest, "/") == 0) && is_settings_name(source);
}

}  // namespace

bool SettingsCopy::parse(char** command) {
  char line[PATH_MAX];
  const char* words[kMostWords] = {};
  int count = 0;
  if (command[1] == nullptr) {
    if (strlen(command[0]) >= sizeof line) return false;
    count = split_line(strcpy(line, command[0]), words);
  } else {
    while (count < kMostWords && command[count] != nullptr) words[count] = command[count], count++;
  }
  const bool forced = count == 4 && strcmp(words[1], "-f") == 0;
  if ((count != 3 && !forced) || strcmp(words[0], "cp") != 0) return false;
  const char* from = words[count - 2];
  if (!leads_to_settings(from, words[count - 1]) || strlen(from) >= sizeof source) return false;
  strcpy(source, from);
  return true;
}

int SettingsCopy::run() const {
  const platform::Fd from(open(source, O_RDONLY | O_NONBLOCK | O_CLOEXEC));
  if (!is_regular(from.get())) {
    platform::report(LOG_WARNING, "flashrun: %s: %s", source, strerror(errno));
    return 1;
  }
  const platform::Fd folder(open(kFlashFolder, O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  const Turn turn;
  if (turn.held() && folder.ok()) clear_left_overs(folder.get());
  if (folder.ok() && replace_settings(folder.get(), from.get())) return 0;
  platform::report(LOG_WARNING, "flashrun: %s is not copied to %s: %s", source, kFlashFolder,
                   strerror(errno));
  return 1;
}

KeptSettings::~KeptSettings() {
  if (kept_ >= 0) close(kept_);
  if (folder_ >= 0) close(folder_);
}

bool KeptSettings::keep() {
  folder_ = open(kFlashFolder, O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (folder_ < 0) return false;
  const Turn turn;
  if (!turn.held()) return false;
  clear_left_overs(folder_);
  const platform::Fd settings(openat(folder_, kSettingsName, kReading));
  if (!is_whole(settings.get())) return false;
  make_name(name_, kKept);
  kept_ = openat(folder_, name_, kMaking, 0600);
  if (kept_ < 0) return false;
  if (flock(kept_, LOCK_EX | LOCK_NB) == 0 && copy_out(settings.get(), kept_) && fsync(folder_) == 0) {
    return true;
  }
  unlinkat(folder_, name_, 0);
  close(kept_);
  kept_ = -1;
  return false;
}

bool KeptSettings::settle() {
  if (kept_ < 0) return true;
  const Turn turn;
  const bool whole = end_keeping(folder_, name_);
  close(kept_);
  kept_ = -1;
  return whole;
}

}  // namespace flash
