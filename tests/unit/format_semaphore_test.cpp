// The format semaphore: results, messages, whose it is. Several real runs at once are in the command line
// tests.
#include "support/format_semaphore.h"

#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>

#include "volume_fixture.h"

using namespace remvol;

namespace {

constexpr uid_t kStranger = 12345;

class FormatSemaphore : public VolumeTest {
 protected:
  FormatSemaphore() { debug_level = 2; }

  // Runs `what` with its output in `log`.
  int call(const std::function<int()>& what) {
    int result = 0;
    log = fakes::output_of([&] { result = what(); });
    return result;
  }

  // Makes the set as another user would, with nobody let in; gives its id.
  static int made_by_stranger() {
    const pid_t child = fork();
    if (child == 0) {
      const bool changed = setresuid(kStranger, kStranger, kStranger) == 0;
      _exit(changed && semget(90111, 1, IPC_CREAT | 0666) != -1 ? 0 : 1);
    }
    int status = 1;
    waitpid(child, &status, 0);
    EXPECT_EQ(status, 0);
    return semget(90111, 1, 0666);
  }

  static semid_ds status_of(int sem_id) {
    semid_ds status{};
    EXPECT_EQ(semctl(sem_id, 0, IPC_STAT, &status), 0);
    return status;
  }

  std::string log;
};

}  // namespace

TEST_F(FormatSemaphore, TheFirstFormatMakesTheSemaphoreAndTheLastRemovesIt) {
  int sem_id = -1;
  EXPECT_EQ(call([&] { return format_sem_P(&sem_id, 1); }), 0);
  EXPECT_EQ(fakes::calls(), (Texts{"semget 90111 1 666", "semget 90111 1 1666", "semctl IPC_SET 600",
                                   "semctl GETNCNT", "semctl SETVAL 1", "semop -1 SEM_UNDO"}));
  EXPECT_GE(sem_id, 0);
  EXPECT_TRUE(has(log, "semget(...) == -1, errno = 2"));
  EXPECT_TRUE(has(log, "try to semget(90111 1, 0666 | IPC_CREATE )"));
  EXPECT_TRUE(has(log, "get sem_id = " + std::to_string(sem_id)));
  EXPECT_TRUE(has(log, "try to get a sem, sem_id = " + std::to_string(sem_id) + ", trying......"));
  EXPECT_TRUE(has(log, "pid = " + std::to_string(getpid()) + ", go into format critical section ..."));
  EXPECT_EQ(semctl(sem_id, 0, GETVAL), 0);
  EXPECT_EQ(call([&] { return format_sem_V(&sem_id); }), 0);
  EXPECT_EQ(sem_id, -1);
  EXPECT_EQ(fakes::calls({"semop"}).size(), 1u) << "it is removed, not released";
  EXPECT_TRUE(has(log, "fmt_semncnt = 0"));
  EXPECT_EQ(semget(90111, 1, 0666), -1);
}

TEST_F(FormatSemaphore, AnInitialValueBelowOneCountsAsOne) {
  for (const int initial : {0, -7, 3}) {
    int sem_id = -1;
    EXPECT_EQ(format_sem_P(&sem_id, initial), 0);
    EXPECT_EQ(semctl(sem_id, 0, GETVAL), initial > 0 ? initial - 1 : 0);
    EXPECT_EQ(format_sem_V(&sem_id), 0);
  }
}

TEST_F(FormatSemaphore, ASemaphoreThatExistsIsNotSetAgain) {
  const int made = semget(90111, 1, IPC_CREAT | 0666);
  ASSERT_EQ(semctl(made, 0, SETVAL, 2), 0);
  int sem_id = -1;
  EXPECT_EQ(format_sem_P(&sem_id, 7), 0);
  EXPECT_EQ(sem_id, made);
  EXPECT_EQ(semctl(made, 0, GETVAL), 1);
  for (const std::string& call : fakes::calls({"semctl"})) EXPECT_NE(call, "semctl SETVAL 7");
}

TEST_F(FormatSemaphore, ASemaphoreThatCannotBeHad) {
  int sem_id = -7;
  fakes::on("semget", "90111 1 666").returns(-1).error(EACCES).times(1);
  EXPECT_EQ(call([&] { return format_sem_P(&sem_id, 1); }), -1);
  EXPECT_TRUE(has(log, "semget() failed"));
  fakes::on("semget", "90111 1 666").returns(-1).error(EIDRM).times(1);
  fakes::on("semget", "90111 1 1666").returns(-1).error(ENOSPC).times(1);
  EXPECT_EQ(call([&] { return format_sem_P(&sem_id, 1); }), -1);
  EXPECT_TRUE(has(log, "semget(..., IPC_CREATE ) failed"));
  fakes::on("semctl", "SETVAL").returns(-1).error(ERANGE).times(1);
  EXPECT_EQ(call([&] { return format_sem_P(&sem_id, 1); }), -1);
  EXPECT_TRUE(has(log, "semctl() failed, errno = 34"));
  EXPECT_EQ(fakes::calls({"semctl"}).back(), "semctl IPC_RMID");
  EXPECT_EQ(sem_id, -7);
  EXPECT_TRUE(fakes::calls({"semop"}).empty());
}

TEST_F(FormatSemaphore, AFailedWait) {
  int sem_id = -1;
  fakes::on("semop").returns(-1).error(EINTR);
  EXPECT_EQ(call([&] { return format_sem_P(&sem_id, 1); }), -2);
  EXPECT_TRUE(has(log, "set sem failed"));
}

// The last user removes it when nobody waits: one that has its id may come a moment too late.
TEST_F(FormatSemaphore, OneThatIsRemovedBeforeTheWaitIsMadeAgain) {
  fakes::on("semop").does([] { semctl(semget(90111, 1, 0666), 0, IPC_RMID); }).times(1).then_real();
  int sem_id = -1;
  EXPECT_EQ(call([&] { return format_sem_P(&sem_id, 1); }), 0);
  EXPECT_EQ(fakes::calls({"semop"}).size(), 2U);
  EXPECT_EQ(sem_id, semget(90111, 1, 0666));
  EXPECT_EQ(semctl(sem_id, 0, GETVAL), 0);
  EXPECT_FALSE(has(log, "set sem failed"));
}

TEST_F(FormatSemaphore, OneThatIsAlwaysRemovedIsNotMadeForEver) {
  for (const int error : {EIDRM, EINVAL}) {
    const size_t before = fakes::calls({"semop"}).size();
    fakes::on("semop").returns(-1).error(error).times(16);
    int sem_id = -1;
    EXPECT_EQ(call([&] { return format_sem_P(&sem_id, 1); }), -2);
    EXPECT_TRUE(has(log, "set sem failed"));
    EXPECT_EQ(fakes::calls({"semop"}).size(), before + 16);
  }
}

TEST_F(FormatSemaphore, WhileAnotherWaitsTheSemaphoreIsReleased) {
  int sem_id = -1;
  ASSERT_EQ(format_sem_P(&sem_id, 1), 0);
  fakes::on("semctl", "GETNCNT").returns(1);
  EXPECT_EQ(call([&] { return format_sem_V(&sem_id); }), 0);
  EXPECT_EQ(fakes::calls({"semop"}).back(), "semop 1 SEM_UNDO");
  EXPECT_EQ(semctl(sem_id, 0, GETVAL), 1);
  EXPECT_TRUE(has(log, "try to RELEASE a sem, sem_id = " + std::to_string(sem_id) + ", trying......"));
}

TEST_F(FormatSemaphore, ARemovalThatFailsFallsBackToTheRelease) {
  int sem_id = -1;
  ASSERT_EQ(format_sem_P(&sem_id, 1), 0);
  fakes::on("semctl", "IPC_RMID").returns(-1).error(EPERM).times(2);
  EXPECT_EQ(call([&] { return format_sem_V(&sem_id); }), 0);
  EXPECT_TRUE(has(log, "try to remove a sem,sem_key = 90111, using sem_id = " + std::to_string(sem_id) +
                           ", trying......"));
  EXPECT_TRUE(has(log, "remove sem_id failed, errno = 1"));
  EXPECT_EQ(semctl(sem_id, 0, GETVAL), 1);
  fakes::on("semop", "1 SEM_UNDO").returns(-1).error(EINVAL);
  EXPECT_EQ(call([&] { return format_sem_V(&sem_id); }), -2);
  EXPECT_TRUE(has(log, "release sem failed"));
}

TEST_F(FormatSemaphore, AHolderDoesNotWaitForItself) {
  int first = -1;
  int second = -1;
  ASSERT_EQ(format_sem_P(&first, 1), 0);
  fakes::on("semop").returns(-1).error(EDEADLK);  // in its place: it would wait for ever
  EXPECT_EQ(call([&] { return format_sem_P(&second, 1); }), 0);
  EXPECT_EQ(second, first);
  EXPECT_EQ(fakes::calls({"semop"}), Texts{"semop -1 SEM_UNDO"});
  EXPECT_EQ(format_sem_V(&second), 0);
  EXPECT_EQ(semget(90111, 1, 0666), -1) << "left once, it is gone";
}

TEST_F(FormatSemaphore, WhatAFormatLeftIsReleasedOnce) {
  int sem_id = -1;
  ASSERT_EQ(format_sem_P(&sem_id, 1), 0);
  format_sem_release_leftover();
  EXPECT_EQ(semget(90111, 1, 0666), -1);
  const size_t calls = fakes::calls({"semctl"}).size();
  format_sem_release_leftover();
  EXPECT_EQ(fakes::calls({"semctl"}).size(), calls) << "there is nothing left to release";
  EXPECT_EQ(format_sem_P(&sem_id, 1), 0) << "it can be taken again";
}

TEST_F(FormatSemaphore, AfterItsMakingItIsClosedToOthers) {
  int sem_id = -1;
  ASSERT_EQ(format_sem_P(&sem_id, 1), 0);
  const semid_ds status = status_of(sem_id);
  EXPECT_EQ(status.sem_perm.mode & 0777, 0600);
  EXPECT_EQ(status.sem_perm.uid, geteuid());
}

TEST_F(FormatSemaphore, ASetOfAnotherUserIsReplaced) {
  const int stranger = made_by_stranger();
  ASSERT_NE(stranger, -1);
  int sem_id = -1;
  EXPECT_EQ(call([&] { return format_sem_P(&sem_id, 1); }), 0) << "its value is 0: it would wait for ever";
  EXPECT_NE(sem_id, stranger);
  EXPECT_TRUE(has(log, "the format semaphore belongs to user 12345, it is replaced"));
  EXPECT_EQ(status_of(sem_id).sem_perm.cuid, geteuid());
  EXPECT_EQ(semctl(sem_id, 0, GETVAL), 0);
}

TEST_F(FormatSemaphore, ASetThatWasGivenToAnotherUserIsReplaced) {
  const int given = semget(90111, 1, IPC_CREAT | 0666);
  semid_ds status = status_of(given);
  status.sem_perm.uid = kStranger;
  ASSERT_EQ(semctl(given, 0, IPC_SET, &status), 0);
  int sem_id = -1;
  EXPECT_EQ(format_sem_P(&sem_id, 1), 0);
  EXPECT_NE(sem_id, given);
}

TEST_F(FormatSemaphore, AStrangerWhoMakesItAnewEveryTimeIsNotFollowedForEver) {
  made_by_stranger();
  fakes::on("semctl", "IPC_RMID").returns(0).times(16);  // it is there again at once
  int sem_id = -1;
  EXPECT_EQ(call([&] { return format_sem_P(&sem_id, 1); }), -1);
  EXPECT_TRUE(has(log, "semget() failed"));
  EXPECT_TRUE(fakes::calls({"semop"}).empty());
}
