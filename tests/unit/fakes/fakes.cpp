#include "fakes.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <deque>
#include <new>

#include "shared.h"

namespace fakes {

namespace {

struct Script {
  std::deque<Rule> rules, last;
  size_t counters = 0;
};

Script& script() {
  static Script all;
  return all;
}

std::vector<std::vector<std::string>> lines() {
  const Hold hold;
  std::vector<std::vector<std::string>> found;
  const char* at = shared().log;
  const char* end = at + shared().log_size;
  while (at < end) {
    std::vector<std::string> fields;
    std::string line = at;
    at += line.size() + 1;
    size_t from = 0;
    for (size_t to; (to = line.find('\x1f', from)) != std::string::npos; from = to + 1) {
      fields.push_back(line.substr(from, to - from));
    }
    fields.push_back(line.substr(from));
    found.push_back(fields);
  }
  return found;
}

std::string joined(const std::vector<std::string>& fields) {
  std::string text;
  for (const std::string& field : fields) text += (text.empty() ? "" : " ") + field;
  return text;
}

bool is_tree_write(const std::string& kind) {
  return kind == "set" || kind == "del" || kind == "dump";
}

}  // namespace

Shared& shared() {
  static Shared* area = [] {
    void* map = mmap(nullptr, sizeof(Shared), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    if (map == MAP_FAILED) abort();
    return new (map) Shared;
  }();
  return *area;
}

Rule::Rule(std::string function, Subject subject, size_t counter)
    : function_(std::move(function)), subject_(std::move(subject)), counter_(counter) {}

Rule& Rule::returns(long long result) {
  result_ = result;
  return *this;
}

Rule& Rule::error(int number) {
  error_ = number;
  return *this;
}

Rule& Rule::text(std::string text) {
  text_ = std::move(text);
  return *this;
}

Rule& Rule::times(int count) {
  times_ = count;
  return *this;
}

Rule& Rule::skip(int count) {
  skip_ = count;
  return *this;
}

Rule& Rule::does(std::function<void()> action) {
  action_ = std::move(action);
  return *this;
}

Rule& Rule::then_real() {
  then_real_ = true;
  return *this;
}

bool Rule::takes(const std::string& function, const std::string& subject) const {
  if (function != function_ || !subject_.fits(subject)) return false;
  const int met = static_cast<int>(shared().counters[counter_].fetch_add(1));
  return met >= skip_ && (times_ < 0 || met < skip_ + times_);
}

Rule& on(const std::string& function, Subject subject) {
  return script().rules.emplace_back(function, std::move(subject), script().counters++);
}

Rule& otherwise(const std::string& function, Subject subject) {
  return script().last.emplace_back(function, std::move(subject), script().counters++);
}

bool answered(const std::string& function, const std::vector<std::string>& arguments, Answer* answer) {
  const int saved = errno;
  const std::string subject = arguments.empty() ? "" : arguments[0];
  const Rule* found = nullptr;
  for (std::deque<Rule>* rules : {&script().rules, &script().last}) {
    for (const Rule& rule : *rules) {
      if (found == nullptr && rule.takes(function, subject)) found = &rule;
    }
  }
  errno = saved;
  if (found == nullptr) return false;
  if (found->action_) found->action_();
  if (found->then_real_) return false;
  answer->result = found->result_;
  answer->text = found->text_;
  errno = found->error_ != 0 ? found->error_ : saved;
  return true;
}

bool needs_answer(const std::string& function, const std::vector<std::string>& arguments, Answer* answer) {
  if (answered(function, arguments, answer)) return true;
  record("unanswered", {function, joined(arguments)});
  return false;
}

void record(const std::string& kind, const std::vector<std::string>& fields) {
  const int saved = errno;
  std::string line = kind;
  for (const std::string& field : fields) line += '\x1f' + field;
  const Hold hold;
  if (shared().log_size + line.size() + 1 > sizeof(Shared::log)) abort();
  memcpy(shared().log + shared().log_size, line.c_str(), line.size() + 1);
  shared().log_size += line.size() + 1;
  errno = saved;
}

std::vector<std::string> calls(const std::vector<std::string>& kinds) {
  std::vector<std::string> found;
  for (const std::vector<std::string>& line : lines()) {
    const bool wanted = kinds.empty() ? !is_tree_write(line[0])
                                      : std::find(kinds.begin(), kinds.end(), line[0]) != kinds.end();
    if (wanted) found.push_back(joined(line));
  }
  return found;
}

std::vector<std::string> commands() {
  std::vector<std::string> found;
  for (const std::vector<std::string>& line : lines()) {
    if (line[0] == "system" || line[0] == "popen") found.push_back(line[1]);
  }
  return found;
}

std::vector<std::string> writes() {
  std::vector<std::string> found;
  for (const std::vector<std::string>& line : lines()) {
    if (line[0] == "set") found.push_back("set " + line[1] + "=" + line[2]);
    if (line[0] == "del" || line[0] == "dump") found.push_back(line[0] + " " + line[1]);
  }
  return found;
}

std::string output_of(const std::function<void()>& function) {
  fflush(stdout);
  const int kept = dup(STDOUT_FILENO);
  const int file = memfd_create("output", MFD_CLOEXEC);
  dup2(file, STDOUT_FILENO);
  function();
  fflush(stdout);
  dup2(kept, STDOUT_FILENO);
  close(kept);
  std::string text(static_cast<size_t>(lseek(file, 0, SEEK_END)), '\0');
  if (pread(file, text.data(), text.size(), 0) < 0) abort();
  close(file);
  return text;
}

Test::Test() {
  const Hold hold;
  script() = Script();
  for (std::atomic<unsigned>& counter : shared().counters) counter = 0;
  shared().node_count = 0;
  shared().log_size = 0;
}

Test::~Test() = default;

void Test::TearDown() {
  for (const std::string& call : calls({"unanswered"})) ADD_FAILURE() << call;
}

testing::AssertionResult Test::has(const std::string& log, const std::string& message) {
  if (log.find("): " + message + "\n") != std::string::npos) return testing::AssertionSuccess();
  return testing::AssertionFailure() << "no message '" << message << "' in\n" << log;
}

std::string Test::messages(const std::function<void()>& function) {
  const Expression prefix{R"(\([^:()]+:[^:()]+:[0-9]+\): )"};
  std::string text = output_of(function), kept;
  while (const std::optional<Match> found = match(prefix, text)) {
    kept += found->before;
    text = found->after;
  }
  return kept + text;
}

}  // namespace fakes
