#include "shares/reload.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>

#include "common/utf8.h"
#include "shares/access.h"
#include "shares/process.h"
#include "shares/volume_list.h"

namespace shares {
namespace {

constexpr char kUntoldMark[] = ".untold";  // behind the name of the generated file

Section share_of(const SharedVolume& volume, const ShareServer& server, const AccessRule* rule) {
  std::string options = volume.read_only ? "\tread only = yes\n" : "\tread only = no\n";
  if (rule != nullptr) options += access_option(*rule);
  if (volume.extended_attributes) options += server.attribute_options;
  return make_section(volume.name, volume.path, options);
}

std::vector<Section> shares_of(const std::vector<SharedVolume>& volumes, const ShareServer& server,
                               const Access& access) {
  std::vector<Section> sections;
  std::vector<std::wstring> taken = server.taken;
  for (const SharedVolume& volume : volumes) {
    const std::wstring folded = folded_name(volume.name);
    const AccessRule* rule = rule_of(access, volume.name);
    const char* why = volume.failure;
    if (why == nullptr && !volume.mounted) continue;
    if (why == nullptr) why = name_refusal(volume.name, server.names);
    if (why == nullptr && std::find(taken.begin(), taken.end(), folded) != taken.end()) {
      why = "another share has this name";
    }
    if (why == nullptr && rule != nullptr && !server.takes_blanks && has_blanks(*rule)) {
      why = "the file server takes no blanks in the names of its users";
    }
    if (why != nullptr) {
      log_line(LOG_WARNING, "volume \"%s\" is not shared: %s", platform::printable(volume.name).c_str(), why);
      continue;
    }
    taken.push_back(folded);
    sections.push_back(share_of(volume, server, rule));
  }
  return sections;
}

std::vector<Section> still_mounted(std::vector<Section> sections) {
  std::erase_if(sections, [](const Section& section) { return !is_mounted(section.path); });
  return sections;
}

std::vector<Section> missing_from(const std::vector<Section>& now, std::vector<Section> before) {
  std::erase_if(before, [&now](const Section& old) {
    return std::any_of(now.begin(), now.end(),
                       [&old](const Section& share) { return share.name == old.name; });
  });
  return before;
}

// Takes the names that are in the mark: one a line.
std::vector<std::string> untold_names(const std::string& mark) {
  std::vector<std::string> names;
  const std::string text = read_file(mark.c_str());
  for (std::string_view rest = text; !rest.empty();) {
    const size_t end = std::min(rest.find('\n'), rest.size());
    names.emplace_back(rest.substr(0, end));
    rest.remove_prefix(std::min(end + 1, rest.size()));
  }
  return names;
}

void add_names(const std::vector<Section>& sections, std::vector<std::string>& names) {
  for (const Section& section : sections) {
    if (std::find(names.begin(), names.end(), section.name) == names.end()) names.push_back(section.name);
  }
}

void mark_untold(const std::string& mark, const std::vector<std::string>& names) {
  std::string text;
  for (const std::string& name : names) text += name + "\n";
  replace_file(mark.c_str(), text);
}

// Shares whose users have changed: whoever is in one and may no longer be is to be put out.
std::vector<Section> barred_in(const std::vector<Section>& now, const std::vector<Section>& before) {
  std::vector<Section> barred;
  for (const Section& share : now) {
    const bool changed = std::any_of(before.begin(), before.end(), [&share](const Section& old) {
      return old.name == share.name && access_line(old.text) != access_line(share.text);
    });
    if (changed) barred.push_back(share);
  }
  return barred;
}

// A rule for a share that is misspelt bars nobody.
void tell_of_strangers(const Access& access, const std::vector<SharedVolume>& volumes) {
  for (const AccessRule& rule : access.rules) {
    const bool known = std::any_of(volumes.begin(), volumes.end(), [&rule](const SharedVolume& volume) {
      return folded_name(volume.name) == rule.folded;
    });
    if (!known) {
      log_line(LOG_WARNING, "%s: no volume has the share name \"%s\"", kAccessFile,
               platform::printable(rule.share).c_str());
    }
  }
}

void tell_what_is_wrong(const Access& access) {
  if (access.line != 0) {
    log_line(LOG_WARNING, "%s, line %d: %s; the shares stay as they are", kAccessFile, access.line,
             access.why);
  } else {
    log_line(LOG_WARNING, "%s: %s; the shares stay as they are", kAccessFile, access.why);
  }
}

std::vector<Section> shares_of_tree(const ShareServer& server, const std::vector<SharedVolume>& volumes,
                                    const std::vector<Section>& before) {
  if (server.withdraw) return {};
  const Access access = read_access(kAccessFile);
  if (access.why != nullptr) {
    tell_what_is_wrong(access);
    return still_mounted(before);
  }
  tell_of_strangers(access, volumes);
  return shares_of(volumes, server, access);
}

}  // namespace

ReloadCommand read_command(int argc, char** argv) {
  if (argc == 1) return ReloadCommand::kReload;
  if (argc == 2 && strcmp(argv[1], "--withdraw") == 0) return ReloadCommand::kWithdraw;
  fprintf(stderr, "usage: %s [--withdraw]\n", argv[0]);
  return ReloadCommand::kWrong;
}

Reload reload_shares(const ShareServer& server) {
  const std::vector<Section> before = parse_sections(read_file(server.file));
  std::vector<SharedVolume> volumes;
  Reload done{};
  done.has_tree = server.withdraw || read_volumes(volumes);
  done.shares = done.has_tree ? shares_of_tree(server, volumes, before) : still_mounted(before);
  const std::string mark = server.file + std::string(kUntoldMark);
  done.cut_off = untold_names(mark);
  add_names(missing_from(done.shares, before), done.cut_off);
  add_names(barred_in(done.shares, before), done.cut_off);
  const bool changed = done.shares != before;
  done.untold = changed || access(mark.c_str(), F_OK) == 0;
  // The mark first: whoever dies behind the other file has told nobody.
  if (changed) mark_untold(mark, done.cut_off);
  if (changed && !replace_file(server.file, compose(server.reload, done.shares))) {
    log_line(LOG_WARNING, "%s cannot be written: %s", server.file, strerror(errno));
  }
  return done;
}

void remember_told(const char* file, const std::vector<std::string>& left) {
  const std::string mark = file + std::string(kUntoldMark);
  if (left.empty()) {
    unlink(mark.c_str());
  } else {
    mark_untold(mark, left);
  }
}

}  // namespace shares
