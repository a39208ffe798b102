#include "vv/completion.h"

#include <algorithm>
#include <string_view>

#include "common/utf8.h"
#include "vv/commands.h"
#include "vv/options.h"
#include "vv/searches.h"
#include "vv/volumes.h"

namespace vv {
namespace {

using Words = std::vector<std::string>;

bool has(const Words& words, const std::string& word) {
  return std::find(words.begin(), words.end(), word) != words.end();
}

void add_shares(Words& offered) {
  const Look look;
  for (const vvstat::Row& row : look.rows()) {
    if (row.volume != nullptr) offered.push_back(row.volume->share);
  }
}

void add_targets(Words& offered) {
  const Look look;
  for (const vvstat::Target& target : look.targets()) offered.push_back(target.name);
}

void add_found_targets(Words& offered) {
  for (const std::string& name : read_found_targets().names) offered.push_back(name);
}

void add_portals(Words& offered) {
  const Look look;
  for (const vvstat::Target& target : look.targets()) {
    offered.push_back(stored_portal(target.address, target.port).text());
  }
}

// The free ones that the last search has found.
void add_luns(const Words& words, Words& offered) {
  const auto option = std::find(words.begin(), words.end(), "--target");
  const std::string target = option == words.end() || option + 1 == words.end() ? "" : *(option + 1);
  for (const FoundLun& lun : read_found_luns(target).luns) {
    if (lun.available) offered.push_back(std::to_string(lun.number));
  }
}

// What goes with the command itself, by the name that the help text has for it.
void add_names(std::string_view argument, Words& offered) {
  if (argument.find("SHARE") != std::string_view::npos) add_shares(offered);
  if (argument.find("TARGET") != std::string_view::npos) add_targets(offered);
  if (argument.starts_with("TARGET")) add_found_targets(offered);
  if (argument == "PORTAL") add_portals(offered);
}

Words first_words() {
  Words offered;
  for (const Command& command : commands()) offered.push_back(command.name);
  offered.insert(offered.end(), {"help", "--help", "--version"});
  return offered;
}

// Whether the command's own argument stands before the last word already.
bool has_argument(const Words& words) {
  for (size_t at = 1; at + 1 < words.size(); at++) {
    if (!words[at].starts_with('-') && (at == 1 || !takes_value(words[at - 1]))) return true;
  }
  return false;
}

Words further_words(const Command& command, const Words& words) {
  Words offered;
  const std::string& before = words[words.size() - 2];
  if (before == "--portal") {
    add_portals(offered);
  } else if (before == "--target") {
    add_targets(offered);
    add_found_targets(offered);
  } else if (before == "--lun") {
    add_luns(words, offered);
  } else if (takes_value(before)) {
    return {};
  } else if (command.argument == nullptr) {
    add_shares(offered);
    add_targets(offered);
  } else if (words.back().starts_with('-')) {
    for (const std::string& option : options_of(command)) {
      if (!has(words, option) || option == words.back()) offered.push_back(option);
    }
  } else if (!has_argument(words)) {
    add_names(command.argument, offered);
  }
  return offered;
}

}  // namespace

Words completions(const Words& words) {
  const Command* command = words.size() < 2 ? nullptr : find_command(words.front().c_str());
  Words offered;
  if (words.size() < 2) offered = first_words();
  if (words.size() == 2 && words.front() == "help") {
    for (const Command& each : commands()) offered.push_back(each.name);
  }
  if (command != nullptr) offered = further_words(*command, words);
  std::erase_if(offered, [](const std::string& word) { return platform::printable(word) != word; });
  Words once;
  for (const std::string& word : offered) {
    if (!has(once, word)) once.push_back(word);
  }
  return once;
}

}  // namespace vv
