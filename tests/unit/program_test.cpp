// Programs that are started: what they get as their streams, how their end is told.
#include "common/program.h"
#include "begin.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <string>

using namespace platform;

namespace {

pid_t start_shell(const char* text, const Streams& streams) {
  const char* const argv[] = {"sh", "-c", text, nullptr};
  return start("sh", argv, streams);
}

std::string content(int file) {
  char text[64] = "";
  const ssize_t size = pread(file, text, sizeof text, 0);
  return {text, size > 0 ? static_cast<size_t>(size) : 0};
}

// Runs `body` in a process of its own, whose streams it may close. Returns its exit status.
template <typename Body>
int apart(Body body) {
  const pid_t child = fork();
  if (child == 0) _exit(body());
  return exit_status(end_of(child));
}

}  // namespace

TEST(Program, ItsOutputAndErrorsGoWhereTheyAreTold) {
  const int file = memfd_create("output", MFD_CLOEXEC);
  const pid_t child = start_shell("echo out; echo err >&2; cat", {kNowhere, file, file});
  EXPECT_EQ(exit_status(end_of(child)), 0);
  EXPECT_EQ(content(file), "out\nerr\n");
  close(file);
}

// A file that is opened would get the number of a stream.
TEST(Program, ACallerWithoutStreamsOfItsOwnMakesNoDifference) {
  for (const int first : {STDIN_FILENO, STDOUT_FILENO}) {
    EXPECT_EQ(apart([first] {
                for (int stream = first; stream <= STDERR_FILENO; stream++) close(stream);
                remvol::begin();
                const int file = memfd_create("output", MFD_CLOEXEC);
                const int other = memfd_create("other", MFD_CLOEXEC);
                const int status = exit_status(end_of(start_shell("echo out", {kNowhere, file, kNowhere})));
                const int told = exit_status(end_of(start_shell("echo out; exit 7", {})));
                const bool sent = status == 0 && content(file) == "out\n" && told == 7;
                return sent && write(first, "", 0) < 0 && content(other).empty() ? 0 : 1;
              }),
              0)
        << first;
  }
}

TEST(Program, StreamsThatAreThereStay) {
  EXPECT_EQ(apart([] {
              const int file = memfd_create("output", 0);
              dup2(file, STDOUT_FILENO);
              close(file);
              remvol::begin();
              const int next = memfd_create("next", MFD_CLOEXEC);
              const int status = exit_status(end_of(start_shell("echo out", {})));
              return next == file && status == 0 && content(STDOUT_FILENO) == "out\n" ? 0 : 1;
            }),
            0);
}

TEST(Program, ItsEndIsTold) {
  EXPECT_EQ(exit_status(end_of(start_shell("exit 3", {}))), 3);
  EXPECT_EQ(exit_status(end_of(start_shell("kill -TERM $$", {}))), -1);
  EXPECT_EQ(exit_status(end_of(1)), -1) << "no child";
  const pid_t child = start_shell("exec sleep 100", {});
  EXPECT_FALSE(ends_within(child, 10));
  kill(child, SIGKILL);
  EXPECT_TRUE(ends_within(child, 10'000));
  EXPECT_EQ(exit_status(end_of(child)), -1);
}

TEST(Program, OneThatIsNotThereIsNotStarted) {
  const char* const argv[] = {"no-such-program", nullptr};
  EXPECT_EQ(start("no-such-program", argv, {}), -1);
  EXPECT_EQ(errno, ENOENT);
}
