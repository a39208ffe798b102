#include "vv/command_line.h"

#include <getopt.h>

#include <charconv>
#include <cstdio>
#include <string>
#include <string_view>
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
    "Exit status: 0 done, 1 failed, 2 wrong usage or no such share or target, 3 the configuration\n"
    "tree cannot be reached, 4 refused: not confirmed, or there is data on the disk.\n"
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

int wrong_usage() {
  fputs("Try 'vv --help'.\n", stderr);
  return kUsage;
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

// Says so and returns false when the command takes no such option.
bool may_take(const Command& command, int letter, unsigned& given) {
  for (const OptionRow& row : option_rows()) {
    if (row.letter != letter) continue;
    given |= row.bit;
    if (takes(command, row)) return true;
    fprintf(stderr, "vv: %s takes no --%s\n", command.name, row.name);
  }
  return false;
}

bool read_lun(std::string_view text, int& lun) {
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), lun);
  if (error == std::errc() && end == text.data() + text.size() && lun >= 0 && lun <= kLastLun) return true;
  fprintf(stderr, "vv: \"%s\" is no number of a LUN\n", platform::printable(text).c_str());
  return false;
}

bool take_text(const char* argument, std::string& field) {
  if (argument[0] == '\0') fputs("vv: the value of an option is empty\n", stderr);
  field = argument;
  return argument[0] != '\0';
}

bool take_option(int letter, Options& options) {
  switch (letter) {
    case kPortalOption:
      return take_text(optarg, options.portal);
    case kTargetOption:
      return take_text(optarg, options.target);
    case kLunOption:
      return read_lun(optarg, options.lun);
    case kUserOption:
      return take_text(optarg, options.user);
    case kPasswordFileOption:
      return take_text(optarg, options.password_file);
    case kPasswordOption:
      fputs("vv: a password is never an argument, others could see it: --password-file FILE\n", stderr);
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
bool fits(const Options& options, unsigned given) {
  const Command& command = *options.command;
  for (const OptionRow& row : option_rows()) {
    if ((command.needs & row.bit & ~given) == 0) continue;
    fprintf(stderr, "vv: %s needs --%s\n", command.name, row.name);
    return false;
  }
  const char* wrong = nullptr;
  if (options.user.empty() && !options.password_file.empty()) wrong = "--password-file needs --user";
  if (options.no_password && !options.user.empty()) wrong = "either --user or --no-password";
  if ((command.takes & kNoPassword) != 0 && !options.no_password && options.user.empty()) {
    wrong = "password needs --user, or --no-password";
  }
  if (wrong != nullptr) fprintf(stderr, "vv: %s\n", wrong);
  return wrong == nullptr;
}

// The words behind the command.
int read_words(int argc, char** argv, Options& options) {
  const std::vector<option> known = long_options();
  unsigned given = 0;
  for (int letter; (letter = getopt_long(argc, argv, "hV", known.data(), nullptr)) != -1;) {
    if (letter == 'h') return print_help_of(*options.command);
    if (letter == 'V') return print_version();
    if (letter == '?') return wrong_usage();
    if (!may_take(*options.command, letter, given) || !take_option(letter, options)) return wrong_usage();
  }
  if (optind + 1 != argc || argv[optind][0] == '\0') {
    fprintf(stderr, "vv: %s takes one %s\n", options.command->name, options.command->argument);
    return wrong_usage();
  }
  options.name = argv[optind];
  return fits(options, given) ? kGoOn : wrong_usage();
}

}  // namespace

int read_options(int argc, char** argv, Options& options) {
  const std::string_view first = argc > 1 ? argv[1] : "";
  if (first == "-h" || first == "--help") return print_help();
  if (first == "-V" || first == "--version") return print_version();
  if (first == "--complete") return print_completions({argv + 2, argv + argc});
  options.command = argc > 1 ? find_command(argv[1]) : nullptr;
  if (options.command == nullptr) {
    if (argc > 1) fprintf(stderr, "vv: there is no command \"%s\"\n", platform::printable(argv[1]).c_str());
    return wrong_usage();
  }
  options.rest = argv + 2;
  // The messages of getopt_long(3) begin with the first word.
  argv[1] = argv[0];
  return options.command->argument == nullptr ? kGoOn : read_words(argc - 1, argv + 1, options);
}

}  // namespace vv
