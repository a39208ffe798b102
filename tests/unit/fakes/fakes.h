// The fake platform of the unit tests: a configuration tree in memory, the system utilities and the calls
// that the tool makes by name (system, popen, sleep, mknod ...), with a log of what was called and a script
// of answers. Tree, log and counters are shared memory, so what a forked child of the code under test does is
// seen as well.
//
//   class Unmount : public fakes::Test {};
//   TEST_F(Unmount, TriesTwice) {
//     fakes::tree_set({{"/iscsi/initiator/id:1/target", "iqn.t1"}});
//     fakes::on("system", "umount -f \"/mnt/VV/a\"").returns(256).times(1);    // the first call fails
//     fakes::on("ktreec_set", "/iscsi/initiator/count").returns(-1).skip(1);   // all but the first fail
//     fakes::on("sys_get_fs_type", "/dev/sdb1").text("ext4").returns(0);
//     fakes::on("popen", "iscsiadm -m session").text("what it prints\n").returns(21 << 8);
//     ...
//     EXPECT_EQ(fakes::calls(), (std::vector<std::string>{"system umount -f \"/mnt/VV/a\"", "sleep 1"}));
//     EXPECT_EQ(fakes::tree_get("/result/del"), "0");
//   }
//
// A call is answered by the first rule (in the order of on(), then of otherwise()) for its function whose
// subject fits and that is not used up. Without a rule:
//   system, System       succeed (0) and do nothing
//   popen                is refused: the test fails at its end
//   sleep, usleep        take no time; mknod succeeds and does nothing
//   ktreec_*             work on the tree in memory
//   str*                 do what the platform's do
//   sys_*, LIB_*         are refused
//   getaddrinfo, inet_ntop, access, fcntl, fsync, sem*, strdup   are the real ones
// Subjects: the command, the path, the number, the name; the platform's names are in sys_* order of
// arguments.
#ifndef FAKES_FAKES_H
#define FAKES_FAKES_H

#include <gtest/gtest.h>

#include <functional>
#include <initializer_list>
#include <map>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "expression.h"

namespace fakes {

// The tree instance that holds the settings.
inline constexpr char kMainSocket[] = "/var/run/ktree_sock_vv";

// What a rule fits: any subject, exactly one, or those in which an expression is found.
struct Subject {
  Subject() : fits([](const std::string&) { return true; }) {}
  Subject(const char* text) : Subject(std::string(text)) {}
  Subject(std::string text) : fits([text](const std::string& subject) { return subject == text; }) {}
  Subject(Expression expression)
      : fits([expression](const std::string& subject) { return match(expression, subject).has_value(); }) {}

  std::function<bool(const std::string&)> fits;
};

// An answer to calls of one function. The setters give the rule back, to be chained.
class Rule {
 public:
  Rule(std::string function, Subject subject, size_t counter);

  Rule& returns(long long result);  // 0 when not said
  Rule& error(int number);          // errno
  Rule& text(std::string text);     // what the function hands out
  Rule& times(int count);           // so many calls only
  Rule& skip(int count);            // not the first calls
  Rule& does(std::function<void()> action);
  Rule& then_real();  // the action alone; the call goes on as without a rule

 private:
  friend bool answered(const std::string&, const std::vector<std::string>&, struct Answer*);
  bool takes(const std::string& function, const std::string& subject) const;

  std::string function_;
  Subject subject_;
  size_t counter_;
  long long result_ = 0;
  int error_ = 0;
  std::string text_;
  int times_ = -1;
  int skip_ = 0;
  std::function<void()> action_;
  bool then_real_ = false;
};

// Adds a rule. The reference is good until the end of the test.
Rule& on(const std::string& function, Subject subject = Subject());

// The same, asked after all rules of on().
Rule& otherwise(const std::string& function, Subject subject = Subject());

// The log as text, in order, without reads: "system CMD", "popen CMD", "sleep 1", "usleep 100",
// "mknod PATH MODE MAJOR:MINOR", "sys_create_1_partition DEV", "sys_expand_1_partition DEV", "fcntl lock",
// "fcntl unlock", "fcntl wait", "semget KEY COUNT FLAGS", "semctl SETVAL 1", "semctl IPC_SET MODE", "semop -1
// SEM_UNDO", "getaddrinfo NAME". `kinds` empty: all of these. Writes of the tree are in writes().
std::vector<std::string> calls(const std::vector<std::string>& kinds = {});

// The texts given to system and popen.
std::vector<std::string> commands();

// What was asked of the tree, refused or not: "set PATH=VALUE", "del PATH", "dump FILE".
std::vector<std::string> writes();

// The tree in memory, as a test sees it: no rule applies and nothing is logged. What a test sets or deletes,
// another run does, and so counts a change of the slots.
using Values = std::vector<std::pair<std::string, std::string>>;
void tree_set(const Values& values, const char* socket = kMainSocket);
std::optional<std::string> tree_get(const std::string& path, const char* socket = kMainSocket);
void tree_delete(const std::string& path, const char* socket = kMainSocket);

// Every value by its path; the element `id` carries its number, another only from 2 on.
std::map<std::string, std::string> tree_dump(const char* socket = kMainSocket);

// What the function prints on standard output, its children's output included.
std::string output_of(const std::function<void()>& function);

// Every test of a fake platform derives from this: it begins with an empty tree, log and script, and fails at
// its end for calls that nothing answered.
class Test : public testing::Test {
 protected:
  Test();
  ~Test() override;
  void TearDown() override;

  // Whether the log, as output_of() gives it, has the message, a whole line behind any prefix.
  static testing::AssertionResult has(const std::string& log, const std::string& message);

  // What the function logs, without the prefixes.
  static std::string messages(const std::function<void()>& function);
};

// --- for the fakes themselves ---

struct Answer {
  long long result = 0;
  std::string text;
};

// Looks for a rule for the call, the first argument being its subject; acts on it and sets errno. Returns
// whether it answers.
bool answered(const std::string& function, const std::vector<std::string>& arguments, Answer* answer);

// The same for a call that only a rule can answer: without one the test fails and `answer` is as it was.
bool needs_answer(const std::string& function, const std::vector<std::string>& arguments, Answer* answer);

void record(const std::string& kind, const std::vector<std::string>& fields);

}  // namespace fakes

#endif
