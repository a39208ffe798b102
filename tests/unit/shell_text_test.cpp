// What reaches a program through the shell when the values of its command come from outside.
#include "support/shell_text.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstring>
#include <functional>
#include <string>
#include <vector>

#include "fakes.h"
#include "frontend/log.h"
#include "iscsi/iscsiadm.h"
#include "support/coreutils.h"
#include "support/fuser.h"
#include "volume/e2fsprogs.h"

using namespace remvol;

namespace {

using Words = std::vector<std::string>;
using Maker = std::function<std::string(const char* value)>;

constexpr char kPlain[] = "VALUE";
const std::string kEndOfCall = "\x01\x02";

// The shell functions that stand in for the programs: each prints the words it was called with.
const std::string kPrograms =
    "show() { printf '%s\\0' \"$@\" '\x01\x02'; }\n"
    "iscsiadm() { show \"$@\"; }\nping() { show \"$@\"; }\nfuser() { show \"$@\"; }\ndd() { show \"$@\"; }\n"
    "mke2fs() { show \"$@\"; }\nremvol() { show \"$@\"; }\necho() { show \"$@\"; }\nPATH=\n";

std::string read_all(int fd) {
  std::string text;
  char part[4096];
  for (ssize_t count; (count = read(fd, part, sizeof part)) > 0;)
    text.append(part, static_cast<size_t>(count));
  return text;
}

// Runs the script and returns the words of each call in it.
std::vector<Words> calls_of(const char* shell, const std::string& script) {
  int ends[2];
  EXPECT_EQ(pipe2(ends, O_CLOEXEC), 0);
  const pid_t child = fork();
  if (child == 0) {
    dup2(ends[1], STDOUT_FILENO);
    dup2(ends[1], STDERR_FILENO);  // a complaint of the shell is a call that nobody expects
    if (chdir("/proc/self/task") != 0) _exit(1);
    execl(shell, "sh", "-c", (kPrograms + script).c_str(), nullptr);
    _exit(127);
  }
  close(ends[1]);
  const std::string output = read_all(ends[0]);
  close(ends[0]);
  waitpid(child, nullptr, 0);

  std::vector<Words> calls(1);
  size_t at = 0;
  for (size_t end; (end = output.find('\0', at)) != std::string::npos; at = end + 1) {
    const std::string word = output.substr(at, end - at);
    if (word == kEndOfCall) {
      calls.emplace_back();
    } else {
      calls.back().push_back(word);
    }
  }
  EXPECT_EQ(output.substr(at), "");
  calls.pop_back();
  return calls;
}

std::string with(std::string word, const std::string& value) {
  const size_t at = word.find(kPlain);
  return at == std::string::npos ? word : word.replace(at, strlen(kPlain), value);
}

// Every byte alone, in the middle of a word, and what is said to break a command.
Words hostile_values() {
  Words values = {"$(touch /f)", "`touch /f`", "x;touch /f", "x|y",   "x\ny", "\\\"", "\"; touch /f; \"",
                  "'",           "-rf",        "--",         "$HOME", "a b",  "\\",   "\\\n",
                  "*",           "~",          "{a,b}",      "#x",    "!!",   ""};
  for (int byte = 1; byte < 256; byte++) {
    const std::string text(1, static_cast<char>(byte));
    if (byte <= 2) continue;  // they mark the end of a call here
    values.push_back(text);
    values.push_back("a" + text + "b");
  }
  return values;
}

TargetEntry plain_entry() {
  TargetEntry entry{};
  copy_text(entry.target_name, "iqn.t");
  copy_text(entry.ip, "10.0.0.1");
  copy_text(entry.iface, "default");
  copy_text(entry.chap_name, "user");
  copy_text(entry.chap_pwd, "secret");
  entry.port = 3260;
  return entry;
}

// The command of an entry whose `field` holds the value.
template <size_t N>
Maker of_entry(CommandText (*command)(const TargetEntry&), char (TargetEntry::*field)[N]) {
  return [=](const char* value) {
    TargetEntry entry = plain_entry();
    copy_text(entry.*field, value);
    return std::string(command(entry));
  };
}

struct Place {
  const char* name;
  Maker make;
  std::function<bool(const std::string&)> takes;
};

bool plain(const std::string& value) {
  return is_plain_word(value.c_str());
}

bool any(const std::string&) {
  return true;
}

bool one_line(const std::string& value) {
  return value.find('\n') == std::string::npos;
}

const Place kPlaces[] = {
    {"new target", of_entry(new_node_command, &TargetEntry::target_name), plain},
    {"new portal", of_entry(new_node_command, &TargetEntry::ip), plain},
    {"new interface", of_entry(new_node_command, &TargetEntry::iface), plain},
    {"delete target", of_entry(delete_node_command, &TargetEntry::target_name), plain},
    {"no auth target", of_entry(no_auth_command, &TargetEntry::target_name), plain},
    {"no auth portal", of_entry(no_auth_command, &TargetEntry::ip), plain},
    {"chap target", of_entry(chap_method_command, &TargetEntry::target_name), any},
    {"chap portal", of_entry(chap_method_command, &TargetEntry::ip), plain},
    {"user", of_entry(chap_user_command, &TargetEntry::chap_name), one_line},
    {"user target", of_entry(chap_user_command, &TargetEntry::target_name), any},
    {"secret", of_entry(chap_secret_command, &TargetEntry::chap_pwd), one_line},
    {"secret portal", of_entry(chap_secret_command, &TargetEntry::ip), plain},
    {"login target", of_entry(login_command, &TargetEntry::target_name), plain},
    {"login portal", of_entry(login_command, &TargetEntry::ip), plain},
    {"login again target", of_entry(login_again_command, &TargetEntry::target_name), any},
    {"portal logout target", of_entry(portal_logout_command, &TargetEntry::target_name), any},
    {"portal logout portal", of_entry(portal_logout_command, &TargetEntry::ip), plain},
    {"logout", of_entry(logout_command, &TargetEntry::target_name), any},
    {"new iface", [](const char* v) { return std::string(new_iface_command(v)); }, plain},
    {"bind iface", [](const char* v) { return std::string(bind_iface_command("iface0", v)); }, any},
    {"users of a node", [](const char* v) { return std::string(end_node_users_command(v)); }, plain},
    {"users of a path", [](const char* v) { return std::string(end_users_command(v)); }, any},
    {"within a word", [](const char* v) { return std::string(wipe_beginning_command(v)); }, plain},
    {"format", [](const char* v) { return std::string(make_ext4_command(v)); }, plain},
    {"single quotes", [](const char* v) { return std::string(shell_command("echo 'Name=%s'", v)); },
     [](const std::string& value) {
       for (const char c : value) {
         if (c == '\'' || c == '\\' || c == '\x7f' || (c > 0 && c < ' ')) return false;
       }
       return true;
     }},
};

class ShellText : public fakes::Test {
 protected:
  ShellText() { debug_level = -1; }
  ~ShellText() override { debug_level = 0; }
};

TEST_F(ShellText, OnlyTextReachesTheShell) {
  const Words values = hostile_values();
  for (const char* shell : {"/bin/dash", "/bin/bash"}) {
    for (const Place& place : kPlaces) {
      const std::vector<Words> plain_calls = calls_of(shell, place.make(kPlain));
      ASSERT_EQ(plain_calls.size(), 1U) << place.name;
      std::string script;
      std::vector<Words> expected;
      for (const std::string& value : values) {
        const std::string command = place.make(value.c_str());
        ASSERT_EQ(command != kRefusedCommand, place.takes(value)) << place.name << " <" << value << ">";
        if (command == kRefusedCommand || value.empty()) continue;
        script += command + "\n";
        expected.push_back(plain_calls[0]);
        for (std::string& word : expected.back()) word = with(word, value);
      }
      EXPECT_EQ(calls_of(shell, script), expected) << shell << ", " << place.name;
    }
  }
}

// Every iSCSI name can be given; RFC 3722.
TEST_F(ShellText, AnIscsiNameIsAPlainWord) {
  EXPECT_TRUE(is_plain_word("iqn.2001-04.com.example:storage.disk2-0.az09"));
  EXPECT_TRUE(is_plain_word("eui.02004567A425678D"));
  EXPECT_TRUE(is_plain_word("[fe80::1%egiga0]"));
}

TEST_F(ShellText, ACommandThatWouldBeCutIsRefused) {
  const std::string fits(CommandText::size() - strlen("x \"\"") - 1, 'a');
  EXPECT_EQ(std::string(shell_command("x \"%s\"", fits.c_str())), "x \"" + fits + "\"");
  EXPECT_STREQ(shell_command("x \"%s\"", (fits + "a").c_str()), kRefusedCommand);
  EXPECT_STREQ(shell_command("x \"%s\"", std::string(fits.size() / 2 + 1, '$').c_str()), kRefusedCommand);
}

TEST_F(ShellText, ACommandQuotesAPath) {
  EXPECT_STREQ(command_on_path("rm -rf", "/mnt/VV/a b"), "rm -rf \"/mnt/VV/a b\"");
  EXPECT_STREQ(command_on_path("rm -rf", "/mnt/VV/\"$`\\"), "rm -rf \"/mnt/VV/\\\"\\$\\`\\\\\"");
}

TEST_F(ShellText, ACommandOnAPathIsNeverCut) {
  const std::string longest(1023, '$');
  std::string escaped;
  for (size_t i = 0; i < longest.size(); i++) escaped += "\\$";
  EXPECT_EQ(std::string(command_on_path("umount -f", longest.c_str())), "umount -f \"" + escaped + "\"");
  EXPECT_STREQ(command_on_path("umount -f", std::string(3000, 'a').c_str()), "false");
}

TEST_F(ShellText, ARefusalIsToldWithoutTheValue) {
  debug_level = 0;
  const std::string told = fakes::output_of([] { (void)shell_command("login -T %s", "a;canary"); });
  EXPECT_NE(told.find("cmd 'login -T %s' is refused"), std::string::npos) << told;
  EXPECT_EQ(told.find("canary"), std::string::npos) << told;
}

// iscsiadm would write outside its records.
TEST_F(ShellText, NoNodeLeavesTheRecords) {
  for (const auto command :
       {new_node_command, delete_node_command, no_auth_command, chap_method_command, chap_user_command,
        chap_secret_command, login_command, portal_logout_command, login_again_command, logout_command}) {
    for (const char* name : {"..", "../../x", "a/../../x", "a/.."}) {
      TargetEntry entry = plain_entry();
      copy_text(entry.target_name, name);
      EXPECT_STREQ(command(entry), kRefusedCommand) << name;
      entry = plain_entry();
      copy_text(entry.ip, name);
      EXPECT_STREQ(command(entry), kRefusedCommand) << name;
    }
    TargetEntry entry = plain_entry();
    copy_text(entry.target_name, "iqn...a/..b");
    EXPECT_STRNE(command(entry), kRefusedCommand);
  }
}

}  // namespace
