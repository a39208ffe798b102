#include "notify/delivery.h"

#include <dirent.h>
#include <fcntl.h>
#include <strings.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <syslog.h>
#include <systemd/sd-journal.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "common/program.h"
#include "common/report.h"
#include "common/utf8.h"

namespace notify {
namespace {

constexpr char kFolder[] = "/etc/remvol/events.d";
constexpr int kPatience = 1000;  // milliseconds that a program is waited for before the next one starts

bool complain(const std::string& subject, const char* why) {
  platform::report(LOG_WARNING, "remvol-notify: %s: %s", subject.c_str(), why);
  return false;
}

// Where no journal listens, standard error gets the message.
bool log_event(const Event& event) {
  const EventForm& form = form_of(event.kind);
  if (access("/run/systemd/journal/socket", W_OK) != 0) {
    fprintf(stderr, "%s\n", event.message.c_str());
    return true;
  }
  const int result = sd_journal_send("MESSAGE=%s", event.message.c_str(), "PRIORITY=%d", form.priority,
                                     "MESSAGE_ID=%s", form.message_id, "EVENT=%s", form.name, "TARGET=%s",
                                     event.target.c_str(), "SHARE=%s", event.share.c_str(), nullptr);
  return result >= 0 || complain("journal", strerror(-result));
}

// Programs at work. One that takes its time is left to itself, so that it holds nothing up.
class Runs {
 public:
  // Runs the words under timeout(1), which ends the program and what it started; `input` is its standard
  // input.
  void start(std::vector<std::string> words, int input = platform::kNowhere) {
    const std::string program = words.front();
    words.insert(words.begin(), {"timeout", "--kill-after=2", "30"});
    const std::vector<const char*> arguments = platform::arguments_of(words);
    const pid_t child = platform::start(arguments[0], arguments.data(), {input});
    if (child < 0) {
      note(complain(program, strerror(errno)));
    } else if (platform::ends_within(child, kPatience)) {
      take_end({program, child});
    } else {
      running_.push_back({program, child});
    }
  }

  void note(bool good) { good_ = good_ && good; }

  // Waits for those that are still at work. Returns false when something failed.
  bool end() {
    for (const Running& running : running_) take_end(running);
    running_.clear();
    return good_;
  }

 private:
  struct Running {
    std::string program;
    pid_t process;
  };

  void take_end(const Running& running) {
    const int status = platform::exit_status(platform::end_of(running.process));
    if (status == 0) return;
    constexpr int kTimedOut = 124, kKilled = 137;
    const bool took_too_long = status == kTimedOut || status == kKilled || status < 0;
    note(complain(running.program, took_too_long ? "took longer than 30 seconds" : "failed"));
  }

  std::vector<Running> running_;
  bool good_ = true;
};

std::string host_name() {
  char name[HOST_NAME_MAX + 1] = "";
  gethostname(name, sizeof name - 1);
  return name;
}

void mail_event(const Event& event, const Config& config, Runs& runs) {
  std::string text = "From: " + (config.mail_from.empty() ? "root" : config.mail_from) + "\n";
  text.append("To: ").append(config.mail_address).append("\n");
  text.append("Subject: ").append(form_of(event.kind).name).append(" on ").append(host_name());
  text.append("\nContent-Type: text/plain; charset=utf-8\nAuto-Submitted: auto-generated\n\n");
  text.append(event.message).append("\n\nvvstat -x shows what needs attention.\n");
  const int mail = memfd_create("mail", MFD_CLOEXEC);
  if (mail < 0 || write(mail, text.data(), text.size()) < 0 || lseek(mail, 0, SEEK_SET) < 0) {
    runs.note(complain("mail", strerror(errno)));
  } else {
    runs.start({"sendmail", "-t"}, mail);
  }
  if (mail >= 0) close(mail);
}

// The rule of run-parts(8) for names.
int is_program_name(const dirent* entry) {
  constexpr char kCharacters[] = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789_-";
  return strspn(entry->d_name, kCharacters) == strlen(entry->d_name) ? 1 : 0;
}

std::vector<std::string> programs() {
  std::vector<std::string> found;
  dirent** entries = nullptr;
  const int count = scandir(kFolder, &entries, is_program_name, alphasort);
  for (int at = 0; at < count; at++) {
    const std::string path = std::string(kFolder) + "/" + entries[at]->d_name;
    struct stat info {};
    if (stat(path.c_str(), &info) == 0 && S_ISREG(info.st_mode) && (info.st_mode & S_IXUSR) != 0) {
      found.push_back(path);
    }
    free(entries[at]);
  }
  free(entries);
  return found;
}

void put_into_environment(const Event& event) {
  setenv("REMVOL_EVENT", form_of(event.kind).name, 1);
  setenv("REMVOL_TARGET", event.target.c_str(), 1);
  setenv("REMVOL_SHARE", event.share.c_str(), 1);
  setenv("REMVOL_MESSAGE", event.message.c_str(), 1);
}

void run_programs(const Event& event, const Config& config, Runs& runs) {
  put_into_environment(event);
  if (!config.program.empty())
    runs.start({config.program, form_of(event.kind).name, event.target, event.share});
  for (const std::string& program : programs()) runs.start({program});
}

std::string rest_of(std::string_view line) {
  const size_t first = line.find_first_not_of(" \t");
  const size_t last = line.find_last_not_of(" \t\r");
  return first == std::string_view::npos ? std::string() : std::string(line.substr(first, last - first + 1));
}

// Where the value of that word goes; null when there is no such word.
std::string* place_of(const std::string& word, Config& config) {
  if (strcasecmp(word.c_str(), "MAILADDR") == 0) return &config.mail_address;
  if (strcasecmp(word.c_str(), "MAILFROM") == 0) return &config.mail_from;
  if (strcasecmp(word.c_str(), "PROGRAM") == 0) return &config.program;
  return nullptr;
}

}  // namespace

Config parse_config(std::string_view text) {
  Config config;
  while (!text.empty()) {
    std::string_view line = text.substr(0, text.find('\n'));
    text.remove_prefix(line.size() + (line.size() < text.size() ? 1 : 0));
    line = line.substr(0, line.find('#'));
    const std::string all = rest_of(line);
    const std::string word = all.substr(0, all.find_first_of(" \t"));
    const std::string value = rest_of(std::string_view(all).substr(word.size()));
    if (word.empty()) continue;
    std::string* place = place_of(word, config);
    if (place == nullptr) {
      complain("remvol.conf", ("no such word: " + platform::printable(word)).c_str());
    } else if (value.empty()) {
      complain("remvol.conf", (word + " has no value").c_str());
    } else {
      *place = value;
    }
  }
  return config;
}

bool deliver(const std::vector<Event>& events, const Config& config) {
  Runs runs;
  for (const Event& event : events) runs.note(log_event(event));
  if (!config.mail_address.empty()) {
    for (const Event& event : events) mail_event(event, config, runs);
  }
  for (const Event& event : events) run_programs(event, config, runs);
  return runs.end();
}

}  // namespace notify
