#include "reload.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>

#include "process.h"
#include "utf8.h"
#include "volume_list.h"

namespace shares {
namespace {

Section share_of(const Volume& volume, const Server& server) {
  std::string options = volume.read_only ? "\tread only = yes\n" : "\tread only = no\n";
  if (volume.extended_attributes) options += server.attribute_options;
  return make_section(volume.name, volume.path, options);
}

std::vector<Section> shares_of(const std::vector<Volume>& volumes, const Server& server) {
  std::vector<Section> sections;
  std::vector<std::wstring> taken = server.taken;
  for (const Volume& volume : volumes) {
    const std::wstring folded = folded_name(volume.name);
    const char* why = volume.failure;
    if (why == nullptr) why = name_refusal(volume.name, server.names);
    if (why == nullptr && std::find(taken.begin(), taken.end(), folded) != taken.end()) {
      why = "another share has this name";
    }
    if (why != nullptr) {
      log_line("volume \"%s\" is not shared: %s", platform::printable(volume.name).c_str(), why);
      continue;
    }
    taken.push_back(folded);
    sections.push_back(share_of(volume, server));
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

}  // namespace

Wish read_wish(int argc, char** argv) {
  if (argc == 1) return Wish::kReload;
  if (argc == 2 && strcmp(argv[1], "--withdraw") == 0) return Wish::kWithdraw;
  fprintf(stderr, "usage: %s [--withdraw]\n", argv[0]);
  return Wish::kWrong;
}

Reload reload_shares(const Server& server) {
  const std::vector<Section> before = parse_sections(read_file(server.file));
  std::vector<Volume> volumes;
  Reload done{};
  done.has_tree = server.withdraw || read_volumes(volumes);
  done.shares = done.has_tree ? shares_of(volumes, server) : still_mounted(before);
  done.gone = missing_from(done.shares, before);
  done.changed = done.shares != before;
  if (done.changed && !replace_file(server.file, compose(server.reload, done.shares))) {
    log_line("%s cannot be written: %s", server.file, strerror(errno));
  }
  return done;
}

}  // namespace shares
