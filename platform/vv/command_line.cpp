#include "vv/command_line.h"

#include <getopt.h>

#include <algorithm>
#include <charconv>
#include <cstdio>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "common/utf8.h"
#include "vv/commands.h"
#include "vv/completion.h"
#include "vv/output.h"

namespace vv {
namespace {

constexpr int kGoOn = -1;
constexpr int kLastLun = 16383;  // SAM-5: the most that a LUN's flat form holds

constexpr char kHelpBegin[] =
    "usage: vv COMMAND [OPTION...]\n"
    "Makes shared folders of the LUNs of remote storage servers.\n"
    "\n"
    "Commands:\n";
constexpr char kHelpEnd[] =
    "\n"
    "Exit status: 0 done, 1 failed, 2 wrong usage or no such share or target,\n"
    "3 the configuration tree cannot be reached, 4 refused: not confirmed, or there\n"
    "is data on the disk.\n"
    "\"vv status\" is vvstat, with its options and exit status.\n";

// As getopt_long(3) wants them.
std::vector<option> long_options() {
  std::vector<option> options;
  for (const OptionRow& row : option_rows()) {
    options.push_back(
        {row.name, row.argument != nullptr ? required_argument : no_argument, nullptr, row.letter});
  }
  options.push_back({});
  return options;
}

// `before`, and the text in quotation marks behind it.
std::string with_quoted(std::string before, std::string_view text) {
  return before.append(" \"").append(platform::printable(text)).append("\"");
}

// Tells what is wrong with the words, in the form that they ask for.
int wrong_usage(const std::string& command, const std::string& why, bool json) {
  if (json) return tell({command, "", "", kUsage, why, {}}, true);
  fprintf(stderr, "vv: %s\n", why.c_str());
  fputs("Try 'vv --help'.\n", stderr);
  return kUsage;
}

// Known before the words are read: what is wrong with them is told in that form.
bool asks_for_json(int argc, char** argv) {
  const std::vector<std::string_view> words(argv + 1, argv + argc);
  return std::find(words.begin(), std::find(words.begin(), words.end(), "--"), "--json") != words.end();
}

// The options that a command takes; all of them without one.
void print_options(const Command* command) {
  puts("\nOptions:");
  for (const OptionRow& row : option_rows()) {
    if (row.help == nullptr || (command != nullptr && !takes(*command, row))) continue;
    std::string words = std::string("--") + row.name;
    if (row.argument != nullptr) words += std::string(" ") + row.argument;
    printf("  %-24s %s\n", words.c_str(), row.help);
  }
}

int print_help() {
  fputs(kHelpBegin, stdout);
  for (const Command& command : commands()) {
    const char* argument = command.argument != nullptr ? command.argument : "...";
    const std::string words = std::string(command.name) + " " + argument;
    printf("  %-28s %s\n", words.c_str(), command.help);
  }
  printf("  %-28s %s\n", "help [COMMAND]", "this text, or that of a command");
  print_options(nullptr);
  fputs(kHelpEnd, stdout);
  return finish(kDone);
}

int print_help_of(const Command& command) {
  printf("usage: vv %s [OPTION...] %s\n%s\n", command.name, command.argument, command.help);
  print_options(&command);
  return finish(kDone);
}

int print_version() {
  puts("vv " REMVOL_VERSION);
  return finish(kDone);
}

// For the shells.
int print_completions(const std::vector<std::string>& words) {
  for (const std::string& word : completions(words)) puts(word.c_str());
  return kDone;
}

// The functions below return false after saying `why`.

bool may_take(const Command& command, int letter, unsigned& given, std::string& why) {
  for (const OptionRow& row : option_rows()) {
    if (row.letter != letter) continue;
    given |= row.bit;
    if (takes(command, row)) return true;
    why = std::string(command.name) + " takes no --" + row.name;
  }
  return false;
}

bool read_lun(std::string_view text, int& lun, std::string& why) {
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), lun);
  if (error == std::errc() && end == text.data() + text.size() && lun >= 0 && lun <= kLastLun) return true;
  why = with_quoted("no number of a LUN:", text);
  return false;
}

bool take_text(int letter, std::string& field, std::string& why) {
  field = optarg;
  for (const OptionRow& row : option_rows()) {
    if (field.empty() && row.letter == letter) why = std::string("the value of --") + row.name + " is empty";
  }
  return !field.empty();
}

bool take_option(int letter, Options& options, std::string& why) {
  switch (letter) {
    case kPortalOption:
      return take_text(letter, options.portal, why);
    case kTargetOption:
      return take_text(letter, options.target, why);
    case kLunOption:
      return read_lun(optarg, options.lun, why);
    case kUserOption:
      return take_text(letter, options.user, why);
    case kPasswordFileOption:
      return take_text(letter, options.password_file, why);
    case kPasswordOption:
      why = "a password is never an argument, others could see it: --password-file FILE";
      return false;
    case kNoPasswordOption:
      return options.no_password = true;
    case kDestroyDataOption:
      return options.destroy_data = true;
    case kYesOption:
      return options.yes = true;
    case kJsonOption:
      return options.json = true;
    default:
      return false;
  }
}

// What is there must go together.
bool fits(const Options& options, unsigned given, std::string& why) {
  const Command& command = *options.command;
  if (options.user.empty() && !options.password_file.empty()) why = "--password-file needs --user";
  if (options.no_password && !options.user.empty()) why = "either --user or --no-password";
  if ((command.takes & kNoPassword) != 0 && !options.no_password && options.user.empty()) {
    why = "password needs --user, or --no-password";
  }
  for (const OptionRow& row : option_rows()) {
    if ((command.needs & row.bit & ~given) != 0) why = std::string(command.name) + " needs --" + row.name;
  }
  return why.empty();
}

// What getopt_long(3) has found wrong with the word before the next one: `letter` is its answer.
std::string why_not(int letter, std::string_view word) {
  const std::string_view name = word.substr(0, word.find('='));
  if (letter == ':') return with_quoted("an argument is missing after the option", name);
  if (optopt >= kPortalOption) return with_quoted("no value belongs to the option", name);
  return with_quoted("unrecognized option", name);
}

// The words after the command.
int read_words(int argc, char** argv, Options& options, std::string& why) {
  const std::vector<option> known = long_options();
  unsigned given = 0;
  opterr = 0;
  for (int letter; (letter = getopt_long(argc, argv, ":hV", known.data(), nullptr)) != -1;) {
    if (letter == 'h') return print_help_of(*options.command);
    if (letter == 'V') return print_version();
    if (letter == '?' || letter == ':') {
      why = why_not(letter, argv[optind - 1]);
      return kUsage;
    }
    if (!may_take(*options.command, letter, given, why) || !take_option(letter, options, why)) return kUsage;
  }
  if (optind + 1 != argc || argv[optind][0] == '\0') {
    why = std::string(options.command->name) + " takes one " + options.command->argument;
    return kUsage;
  }
  options.name = argv[optind];
  return fits(options, given, why) ? kGoOn : kUsage;
}

// What is wrong with a line that does not begin with a command.
std::string why_no_command(int argc, char** argv) {
  if (argc > 1 && argv[1][0] != '-') return with_quoted("there is no command", argv[1]);
  const auto is_command = [](const char* word) { return find_command(word) != nullptr; };
  return std::any_of(argv + 1, argv + argc, is_command) ? "the command comes first, options behind it"
                                                        : "a command is missing";
}

}  // namespace

int read_options(int argc, char** argv, Options& options) {
  const std::string first = argc > 1 ? argv[1] : "";
  if (first == "-h" || first == "--help" || (first == "help" && argc == 2)) return print_help();
  if (first == "-V" || first == "--version") return print_version();
  if (first == "--complete") return print_completions({argv + 2, argv + argc});
  static char help_option[] = "--help";
  if (first == "help" && argc == 3) {
    std::swap(argv[1], argv[2]);
    argv[2] = help_option;
  }
  const bool json = asks_for_json(argc, argv);
  options.command = argc > 1 ? find_command(argv[1]) : nullptr;
  if (options.command == nullptr) {
    return wrong_usage(platform::printable(argc > 1 ? argv[1] : ""), why_no_command(argc, argv), json);
  }
  std::string why;
  options.rest = argv + 2;
  if (options.command->argument == nullptr) return kGoOn;
  const int status = read_words(argc - 1, argv + 1, options, why);
  return status == kUsage ? wrong_usage(options.command->name, why, json) : status;
}

}  // namespace vv
