#include "tree/settings_file.h"

#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <initializer_list>

#include "frontend/log.h"
#include "ktreec.h"
#include "support/files.h"
#include "support/text.h"
#include "tree/access.h"
#include "tree_layout.h"

namespace remvol {

namespace {

constexpr long kMostRead = 4L << 20;  // the settings of all targets are some ten kibibytes
constexpr const char* kInitiatorPath[] = {"config", "iscsi", "initiator"};
constexpr int kInitiatorDepth = sizeof kInitiatorPath / sizeof *kInitiatorPath;
constexpr char kSettingsFolder[] = "/etc/NAS_CFG";
constexpr char kFileEnd[] = "</config>";
constexpr int kLoadLooks = 50;             // 5 seconds
constexpr useconds_t kLoadPause = 100000;  // microseconds

// A tag of the file: its text, cut to the size, and its last character.
struct Tag {
  char text[32];
  char last;

  bool is_named(const char* name) const {
    const size_t length = strlen(name);
    return strncmp(text, name, length) == 0 && strchr(" \t\r\n/", text[length]) != nullptr;
  }
  bool is_markup() const { return text[0] == '?' || text[0] == '!'; }
  bool closes() const { return text[0] == '/'; }
  bool opens() const { return !is_markup() && !closes() && last != '/'; }
};

// The text of the file, as far as it is looked at. (Not by ftell(3), which asks the kernel each time.)
struct FileText {
  FILE* file;
  long left = kMostRead;

  int next() { return left-- > 0 ? getc(file) : EOF; }
};

// Reads on to the next tag. Returns whether there is one.
bool next_tag(FileText* text, Tag* tag) {
  *tag = Tag();
  bool inside = false;
  size_t length = 0;
  for (int c; (c = text->next()) != EOF;) {
    if (inside && c == '>') return true;
    if (inside) {
      tag->last = static_cast<char>(c);
      if (length < sizeof tag->text - 1) tag->text[length++] = tag->last;
    }
    inside = inside || c == '<';
  }
  return false;
}

// Returns the first character of the text that follows, 0 when the next tag does.
char text_start(FileText* text) {
  const int c = text->next();
  return c != EOF && c != '<' ? static_cast<char>(c) : '\0';
}

// Returns the first character of the text of the initiator's first element `name`, 0 when it has none.
char find_value(FileText text, const char* name) {
  int depth = 0;
  int on_path = 0;  // how many of the open elements lead to it
  for (Tag tag; depth >= 0 && next_tag(&text, &tag);) {
    const bool next = tag.opens() && on_path == depth;
    if (next && depth == kInitiatorDepth && tag.is_named(name)) return text_start(&text);
    if (next && depth < kInitiatorDepth && tag.is_named(kInitiatorPath[depth])) on_path++;
    if (tag.opens()) depth++;
    if (tag.closes()) depth--;
    if (on_path > depth) on_path = depth;
  }
  return '\0';
}

// The same of the file at `path`; one that is there and cannot be read may have it.
char find_value(const char* path, const char* name) {
  const File file(fopen(path, "re"));
  if (file == nullptr) return errno != ENOENT ? '?' : '\0';
  const char found = find_value(FileText{file.get()}, name);
  return found == '\0' && ferror(file.get()) != 0 ? '?' : found;
}

// Nothing but a load of settings of version 0 brings a share beside a target's name.
bool holds_old_targets() {
  for (int n = 1; n <= kMaxTargets; n++) {
    if (tree_present(KeyText(key::kOldShare, n))) return true;
  }
  return false;
}

// Where the folder is missing nobody keeps settings: that is no line of the log, which programs read.
void tell_failed_dump() {
  if (access(kSettingsFolder, F_OK) == 0) {
    LOG(0, "ktreec_dump(%s) failed", kSettingsFile);
  } else {
    begin_line(0, stderr);
    fprintf(stderr, "remvol: the settings are not saved, there is no %s\n", kSettingsFolder);
  }
}

}  // namespace

bool settings_file_is_torn(const char* path) {
  char end[64];
  const File file(fopen(path, "re"));
  if (file == nullptr) return false;
  if (fseek(file.get(), -static_cast<long>(sizeof end), SEEK_END) != 0) rewind(file.get());
  size_t length = fread(end, 1, sizeof end, file.get());
  while (length > 0 && memchr(" \t\r\n", end[length - 1], 4) != nullptr) length--;
  constexpr size_t kEndLength = sizeof kFileEnd - 1;
  return length < kEndLength || memcmp(end + length - kEndLength, kFileEnd, kEndLength) != 0;
}

// Without a version the count tells a loaded tree, but for a count of 0, which a deletion stores in any tree.
// The copy counts where kSettingsFile holds no settings: it would be loaded then.
const char* unloaded_settings() {
  if (tree_present(key::kVersion) || holds_old_targets()) return nullptr;
  const int counted = tree_read_number(key::kTargetCount, -1);
  for (const char* file : {kSettingsFile, kFlashCopy}) {
    if (find_value(file, "ver") != '\0') return file;
    const char count = find_value(file, "count");
    if (count != '\0') return counted > 0 || (counted == 0 && count == '0') ? nullptr : file;
  }
  return nullptr;
}

bool await_loaded_settings() {
  static int looks = 0;
  while (!tree_is_loaded() || unloaded_settings() != nullptr) {
    if (looks == kLoadLooks) return false;
    looks++;
    usleep(kLoadPause);
  }
  return true;
}

bool settings_file_is_unreadable(const char* path) {
  const File file(fopen(path, "re"));
  if (file == nullptr) return errno != ENOENT && errno != ENOTDIR;
  char text[4096];
  while (fread(text, 1, sizeof text, file.get()) > 0) {
  }
  return ferror(file.get()) != 0 && errno != EISDIR;
}

bool store_settings() {
  if (const char* file = unloaded_settings(); file != nullptr) {
    LOG(0, "%s is kept as it is: the tree was never loaded from it", file);
    return false;
  }
  if (ktreec_dump(kVolumesSocket, 0, kSettingsFile) == 0) return true;
  tell_failed_dump();
  return !settings_file_is_torn(kSettingsFile);
}

// By a link, so that there is a settings file at every moment; a file system without links gets it renamed.
void keep_damaged_settings() {
  unlink(kDamagedSettingsFile);
  if (link(kSettingsFile, kDamagedSettingsFile) == 0 || errno == ENOENT) return;
  if (rename(kSettingsFile, kDamagedSettingsFile) == 0) return;
  LOG(0, "%s cannot be kept as %s", kSettingsFile, kDamagedSettingsFile);
}

}  // namespace remvol
