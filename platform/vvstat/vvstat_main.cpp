// vvstat: the state of targets and volumes for an operator. Reads the configuration tree and the kernel's
// tables, and changes nothing.
#include <getopt.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "begin.h"
#include "common/memory.h"
#include "common/utf8.h"
#include "vvstat/columns.h"
#include "vvstat/folding.h"
#include "vvstat/metrics.h"
#include "vvstat/past.h"
#include "vvstat/verdict.h"
#include "vvstat/watch.h"

namespace vvstat {
namespace {

constexpr int kAiling = 1, kFailed = 2, kUnreachable = 3;

struct PageOptions {
  Layout layout;
  bool watch = false;
  bool ailing_only = false;
  bool metrics = false;
  const char* name = nullptr;  // of a share or a target
};

// One look at everything.
struct Snapshot {
  Status status;
  std::vector<Row> rows;
};

Snapshot look(Detail detail) {
  Snapshot look;
  look.status = read_status(platform::TreeListing());
  look.rows = assess(look.status, read_facts(look.status, detail));
  recall(read_history(), look.rows);
  return look;
}

int exit_status(const Snapshot& look) {
  if (!look.status.reachable) return kUnreachable;
  return all_healthy(look.rows) ? 0 : kAiling;
}

const char* why_unreachable() {
  if (geteuid() != 0) return "vvstat: only root may read the configuration tree";
  return "vvstat: the configuration tree cannot be reached; see systemctl status remvol-tree";
}

void tell_unreachable() {
  fprintf(stderr, "%s\n", why_unreachable());
}

std::vector<Row> ailing_among(const std::vector<Row>& rows) {
  std::vector<Row> some;
  for (const Row& row : rows) {
    if (!row.healthy()) some.push_back(row);
  }
  return some;
}

Page page_of(const Snapshot& look, const PageOptions& options) {
  const Layout& layout = options.layout;
  // Whoever takes a report apart wants the rows alone.
  const bool for_people = layout.form == Form::kTable && layout.headings;
  if (!look.status.reachable && for_people) {
    return {"", folded(why_unreachable(), {}, layout.width)};
  }
  if (!look.status.reachable) {
    tell_unreachable();
    return {};
  }
  const std::vector<Row> ailing = options.ailing_only ? ailing_among(look.rows) : std::vector<Row>();
  const std::vector<Row>& rows = options.ailing_only ? ailing : look.rows;
  Page page;
  if (!rows.empty() || layout.form == Form::kJson) page.table = volume_report(rows, layout);
  if (for_people) page.verdict = verdict(look.rows, time(nullptr), layout.width);
  return page;
}

// Each text goes out as a whole: the output has no buffer of its own, see run().
void put(std::string_view text) {
  fwrite(text.data(), 1, text.size(), stdout);
}

// What could not be written is a failure: a full disk must not look like a machine without volumes.
int finish(int status) {
  if (ferror(stdout) == 0 && fflush(stdout) == 0) return status;
  fprintf(stderr, "vvstat: write error: %s\n", strerror(errno));
  return kFailed;
}

size_t width_of_output() {
  winsize size{};
  if (ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col != 0) return size.ws_col;
  const char* columns = getenv("COLUMNS");
  const int width = columns != nullptr ? atoi(columns) : 0;
  return width > 0 ? static_cast<size_t>(width) : Layout().width;
}

int show_once(const PageOptions& options) {
  const Snapshot seen = look(detail_of_report(options.layout));
  if (!seen.status.reachable) {
    tell_unreachable();
    return kUnreachable;
  }
  Page page = page_of(seen, options);
  if (!page.table.empty() && !page.verdict.empty()) page.table += '\n';
  put(page.table.append(page.verdict));
  return finish(exit_status(seen));
}

// For a collector of metrics the absence of the tree is news as well. What keeps it from being read is said
// only where that is the user.
int show_metrics() {
  const Snapshot seen = look(Detail::kHealth);
  if (!seen.status.reachable && geteuid() != 0) tell_unreachable();
  put(metrics(seen.status.reachable, seen.rows, time(nullptr)));
  return finish(exit_status(seen));
}

// Names that would have been one, for a message.
std::string names_in(const Snapshot& look) {
  std::string names;
  for (const Row& row : look.rows) {
    if (row.volume != nullptr) names += ", " + row.volume->share;
  }
  for (const Target& target : look.status.targets) names += ", " + target.name;
  return names.empty() ? "none is configured" : "there are: " + names.substr(2);
}

// Everything of the volume of that share, or of all volumes of that target.
int show_one(const PageOptions& options) {
  const bool is_block = options.layout.form == Form::kTable;
  const Snapshot seen = look(is_block ? detail_of_block(options.layout) : detail_of_report(options.layout));
  if (!seen.status.reachable) {
    tell_unreachable();
    return kUnreachable;
  }
  std::vector<Row> rows;
  for (const Row& row : seen.rows) {
    if (row.target->name == options.name || (row.volume != nullptr && row.volume->share == options.name)) {
      rows.push_back(row);
    }
  }
  if (rows.empty()) {
    fprintf(stderr, "vvstat: there is no share or target \"%s\"; %s\n",
            platform::printable(options.name).c_str(), platform::printable(names_in(seen)).c_str());
    return kFailed;
  }
  const std::vector<Row> shown = options.ailing_only ? ailing_among(rows) : rows;
  if (!is_block) {
    put(volume_report(shown, options.layout));
  } else {
    for (const Row& row : shown) {
      if (&row != shown.data() && options.layout.headings) put("\n");
      put(block(row, options.layout));
    }
  }
  return finish(all_healthy(rows) ? 0 : kAiling);
}

int show_again(PageOptions options) {
  Snapshot last;
  watch([&options, &last](size_t width) {
    if (width != 0) options.layout.width = width;
    last = look(detail_of_report(options.layout));
    return page_of(last, options);
  });
  return finish(exit_status(last));
}

constexpr char kHelp[] =
    "usage: vvstat [OPTION...] [SHARE|TARGET]\n"
    "Shows the volumes of remote targets: how they are, what is wrong and what to do.\n"
    "With a name: everything of that share, or of that target's volumes.\n"
    "  -x, --unhealthy     only what needs attention\n"
    "  -w, --watch         shows it again every second, until q is typed\n"
    "  -o, --output LIST   these columns; with a + before the first, these as well\n"
    "  -b, --bytes         sizes in bytes\n"
    "  -n, --noheadings    the rows alone\n"
    "  -r, --raw           the rows as plain text, blanks as \\x20\n"
    "  -J, --json          JSON, for programs\n"
    "  -P, --prometheus    metrics in the text format of Prometheus\n"
    "  -h, --help          this text\n"
    "  -V, --version       the version\n"
    "Columns:\n";
constexpr char kStatusHelp[] =
    "Exit status: 0 all that is wanted is healthy, 1 something is not, 2 wrong usage,\n"
    "no such share or target, or the output cannot be written, 3 the configuration\n"
    "tree cannot be reached.\n";

constexpr option kLongOptions[] = {{"unhealthy", no_argument, nullptr, 'x'},
                                   {"watch", no_argument, nullptr, 'w'},
                                   {"output", required_argument, nullptr, 'o'},
                                   {"bytes", no_argument, nullptr, 'b'},
                                   {"noheadings", no_argument, nullptr, 'n'},
                                   {"raw", no_argument, nullptr, 'r'},
                                   {"json", no_argument, nullptr, 'J'},
                                   {"prometheus", no_argument, nullptr, 'P'},
                                   {"help", no_argument, nullptr, 'h'},
                                   {"version", no_argument, nullptr, 'V'},
                                   {}};

// What reading the arguments came to: go on, or end with this status.
constexpr int kGoOn = -1;

int wrong_usage() {
  fputs("Try 'vvstat --help'.\n", stderr);
  return kFailed;
}

int take_columns(const char* names, Layout& layout) {
  std::string unknown;
  if (choose_columns(names, layout, unknown)) return kGoOn;
  fprintf(stderr, "vvstat: there is no column \"%s\"\n", platform::printable(unknown).c_str());
  return wrong_usage();
}

int take_option(int letter, PageOptions& options) {
  switch (letter) {
    case 'x':
      options.ailing_only = true;
      return kGoOn;
    case 'w':
      options.watch = true;
      return kGoOn;
    case 'o':
      return take_columns(optarg, options.layout);
    case 'b':
      options.layout.bytes = true;
      return kGoOn;
    case 'n':
      options.layout.headings = false;
      return kGoOn;
    case 'r':
      options.layout.form = Form::kRaw;
      return kGoOn;
    case 'J':
      options.layout.form = Form::kJson;
      return kGoOn;
    case 'P':
      options.metrics = true;
      return kGoOn;
    case 'h':
      put(kHelp + describe_columns() + kStatusHelp);
      return finish(0);
    case 'V':
      put("vvstat " REMVOL_VERSION "\n");
      return finish(0);
    default:
      return wrong_usage();
  }
}

// Whether anything is asked of the output that metrics do not have.
bool asks_for_more(const PageOptions& options) {
  const Layout& layout = options.layout;
  return options.watch || options.ailing_only || options.name != nullptr || layout.form != Form::kTable ||
         layout.bytes || !layout.headings || !layout.columns.empty();
}

// What of the command line does not go together; empty when all of it does. `second` is a word behind the
// name, or null.
std::string conflict(const PageOptions& options, const char* second) {
  if (options.metrics && asks_for_more(options)) return "--prometheus goes with no other option and no name";
  if (second != nullptr) return "one name at a time: \"" + platform::printable(second) + "\" is a second one";
  const bool is_watched = options.watch && options.name != nullptr;
  return is_watched ? "--watch shows all volumes: it goes with no name" : "";
}

int take_arguments(int argc, char** argv, PageOptions& options) {
  for (int letter; (letter = getopt_long(argc, argv, "xwo:bnrJPhV", kLongOptions, nullptr)) != -1;) {
    const int status = take_option(letter, options);
    if (status != kGoOn) return status;
  }
  if (optind < argc) options.name = argv[optind++];
  const std::string why = conflict(options, argv[optind]);
  if (why.empty()) return kGoOn;
  fprintf(stderr, "vvstat: %s\n", why.c_str());
  return wrong_usage();
}

// Colour for a terminal, unless NO_COLOR asks for none (no-color.org).
bool wants_colour() {
  const char* no_colour = getenv("NO_COLOR");
  return isatty(STDOUT_FILENO) != 0 && (no_colour == nullptr || no_colour[0] == '\0');
}

int run(int argc, char** argv) {
  setvbuf(stdout, nullptr, _IONBF, 0);
  PageOptions options;
  const int status = take_arguments(argc, argv, options);
  if (status != kGoOn) return status;
  options.layout.colour = wants_colour();
  options.layout.width = width_of_output();
  if (options.metrics) return show_metrics();
  if (options.name != nullptr) return show_one(options);
  return options.watch ? show_again(options) : show_once(options);
}

}  // namespace
}  // namespace vvstat

int main(int argc, char** argv) {
  remvol::begin();
  platform::end_when_memory_is_short(vvstat::kFailed);
  return vvstat::run(argc, argv);
}
