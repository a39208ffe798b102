// The recover queue.
#include "tree/recover_queue.h"

#include <poll.h>
#include <sys/wait.h>
#include <unistd.h>

#include "fakes.h"
#include "frontend/log.h"

using namespace remvol;

namespace {

class RecoverQueue : public fakes::Test {
 protected:
  ~RecoverQueue() override { debug_level = 0; }
  char name_[256] = "";
};

std::string entry(int q) {
  return "/temp/remvol/recover/queue/id:" + std::to_string(q);
}

}  // namespace

TEST_F(RecoverQueue, FirstInFirstOut) {
  EXPECT_EQ(ktree_insert_recover_queue("a"), 0);
  EXPECT_EQ(ktree_insert_recover_queue("b"), 0);
  EXPECT_EQ(ktree_pop_recover_queue(name_), 0);
  EXPECT_STREQ(name_, "a");
  EXPECT_EQ(fakes::tree_get(entry(1) + "/target_name"), "b");
  EXPECT_EQ(ktree_pop_recover_queue(name_), 0);
  EXPECT_STREQ(name_, "b");
  EXPECT_EQ(ktree_pop_recover_queue(name_), -1);
}

TEST_F(RecoverQueue, WhatIsTakenAndWhereANameGoesIsLogged) {
  debug_level = 2;
  EXPECT_EQ(messages([] { (void)ktree_insert_recover_queue("a"); }), "");
  EXPECT_EQ(messages([this] { (void)ktree_pop_recover_queue(name_); }), "pop a\n");
  debug_level = 3;
  EXPECT_EQ(messages([] { (void)ktree_insert_recover_queue("b"); }), "free ent id: 1\n");
  debug_level = 1;
  EXPECT_EQ(messages([this] { (void)ktree_pop_recover_queue(name_); }), "");
}

TEST_F(RecoverQueue, ANameThatComesWhileAnotherIsTakenIsNotLost) {
  ASSERT_EQ(ktree_insert_recover_queue("a"), 0);
  pid_t other_run = 0;
  fakes::on("ktreec_get_wb", entry(2) + "/target_name").times(1).then_real().does([&] {
    other_run = fork();
    if (other_run == 0) _exit(ktree_pop_recover_queue(name_));
    poll(nullptr, 0, 200);
  });
  EXPECT_EQ(ktree_insert_recover_queue("b"), 0);
  int status = -1;
  ASSERT_EQ(waitpid(other_run, &status, 0), other_run);
  EXPECT_EQ(status, 0);
  EXPECT_FALSE(recover_queue_is_empty());
  EXPECT_EQ(ktree_pop_recover_queue(name_), 0);
  EXPECT_STREQ(name_, "b");
}

TEST_F(RecoverQueue, TheHundredAndFirstIsRefused) {
  for (int q = 1; q <= 100; q++) {
    EXPECT_EQ(ktree_get_free_recover_queue_db_idx(), q);
    ASSERT_EQ(ktree_insert_recover_queue(("t" + std::to_string(q)).c_str()), 0);
  }
  const std::string log = fakes::output_of([] { EXPECT_EQ(ktree_insert_recover_queue("late"), -1); });
  EXPECT_TRUE(has(log, "db failed or exceed max queue length"));
  EXPECT_EQ(ktree_get_free_recover_queue_db_idx(), -1);
  EXPECT_EQ(fakes::tree_get(entry(101) + "/target_name"), std::nullopt);
}

TEST_F(RecoverQueue, ARefusedInsert) {
  fakes::on("ktreec_set", entry(1) + "/target_name").returns(-1);
  const std::string log = fakes::output_of([] { EXPECT_EQ(ktree_insert_recover_queue("a"), -103); });
  EXPECT_TRUE(has(log, "ktreec_set() failed"));
  EXPECT_EQ(fakes::writes().size(), 1u);
}

TEST_F(RecoverQueue, ARefusedDeleteStillGivesTheName) {
  (void)ktree_insert_recover_queue("a");
  fakes::on("ktreec_del", entry(1)).returns(-1);
  const std::string log = fakes::output_of([this] { EXPECT_EQ(ktree_pop_recover_queue(name_), -103); });
  EXPECT_STREQ(name_, "a");
  EXPECT_TRUE(has(log, "ktreec_del() of path '/temp/remvol/recover/queue/id:1' failed"));
}

TEST_F(RecoverQueue, AnEmptyQueueIsNotLogged) {
  debug_level = 3;
  EXPECT_EQ(fakes::output_of([this] { (void)ktree_pop_recover_queue(name_); }), "");
}

TEST_F(RecoverQueue, AnEmptiedEntryIsReused) {
  fakes::tree_set({{entry(1) + "/target_name", ""}, {entry(2) + "/target_name", "b"}});
  EXPECT_EQ(ktree_get_free_recover_queue_db_idx(), 1);
}
