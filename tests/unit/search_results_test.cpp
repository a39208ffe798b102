// Results of a LUN search, and the check of share names.
#include "tree/search_results.h"

#include "fakes.h"
#include "frontend/log.h"

using namespace remvol;

namespace {

constexpr char kSocket[] = "/var/run/ktree_sock_vv_search_lun";

class SearchResults : public fakes::Test {
 protected:
  ~SearchResults() override { debug_level = 0; }
  SearchResults() {
    second_.lun = 7;
    second_.size = 3000000000;
    strcpy(second_.fs_type, "ext4");
    first_.lun = 0;
    first_.size = 1048577;
    strcpy(first_.fs_type, "unknown");
    first_.next = &second_;
  }

  LunNode first_ = {};
  LunNode second_ = {};
};

std::string found(const std::string& name) {
  return fakes::tree_get("/temp/vv_search_lun/" + name, kSocket).value_or("(none)");
}

}  // namespace

TEST_F(SearchResults, LunsOfAStoredTarget) {
  fakes::tree_set({{"/iscsi/initiator/id:1/target", "t"}, {"/iscsi/initiator/id:1/lun/id:1/lun", "7"}});
  const std::string printed =
      fakes::output_of([this] { EXPECT_EQ(ktree_update_search_lun_result(kSocket, &first_, "t"), 0); });
  EXPECT_EQ(printed, "lun0, insys=0, avail=1\nlun7, insys=1, avail=0\n");
  EXPECT_EQ(
      fakes::writes(),
      (std::vector<std::string>{
          "set /temp/vv_search_lun/target_name=t", "set /temp/vv_search_lun/lun/id:1/lun=0",
          "set /temp/vv_search_lun/lun/id:1/size=1048577", "set /temp/vv_search_lun/lun/id:1/avaliable=1",
          "set /temp/vv_search_lun/lun/id:1/fstype=unknown", "set /temp/vv_search_lun/lun/id:2/lun=7",
          "set /temp/vv_search_lun/lun/id:2/size=3000000000", "set /temp/vv_search_lun/lun/id:2/avaliable=0",
          "set /temp/vv_search_lun/lun/id:2/fstype=ext4", "set /temp/vv_search_lun/lun/count=2"}));
  EXPECT_EQ(found("lun/count"), "2");
}

TEST_F(SearchResults, EveryWriteIsLogged) {
  debug_level = 1;
  const std::string log =
      fakes::output_of([this] { EXPECT_EQ(ktree_update_search_lun_result(kSocket, &first_, "t"), 0); });
  for (const std::string& write : fakes::writes()) {
    EXPECT_TRUE(has(log, "ktreec_set " + write.substr(strlen("set "))));
  }
  EXPECT_EQ(fakes::writes().size(), 10u);
}

TEST_F(SearchResults, NothingFoundIsLoggedToo) {
  debug_level = 1;
  const std::string log =
      fakes::output_of([] { EXPECT_EQ(ktree_update_search_lun_result(kSocket, nullptr, "t"), 0); });
  EXPECT_TRUE(has(log, "ktreec_set /temp/vv_search_lun/lun/count=0"));
}

TEST_F(SearchResults, AShareNameThatIsUsedIsLogged) {
  fakes::tree_set({{"/iscsi/initiator/id:2/lun/id:1/share", "data"}});
  debug_level = 1;
  EXPECT_EQ(messages([] { EXPECT_EQ(ktree_check_duplicate_share_name("data"), 1); }), "Found data\n");
  EXPECT_EQ(messages([] { EXPECT_EQ(ktree_check_duplicate_share_name("Data"), 0); }), "");
}

TEST_F(SearchResults, EveryLunOfAnUnknownTargetIsAvailable) {
  fakes::output_of([this] { EXPECT_EQ(ktree_update_search_lun_result(kSocket, &first_, "t"), 0); });
  EXPECT_EQ(found("lun/id:1/avaliable"), "1");
  EXPECT_EQ(found("lun/id:2/avaliable"), "1");
}

TEST_F(SearchResults, NothingFound) {
  EXPECT_EQ(ktree_update_search_lun_result(kSocket, nullptr, "t"), 0);
  EXPECT_EQ(found("target_name"), "t");
  EXPECT_EQ(found("lun/count"), "0");
  EXPECT_EQ(ktree_update_search_lun_result(kSocket, nullptr, nullptr), -1);
}

TEST_F(SearchResults, TheFirstRefusedWriteEndsIt) {
  const std::string keys[] = {"target_name",        "lun/id:1/lun",    "lun/id:1/size",
                              "lun/id:1/avaliable", "lun/id:1/fstype", "lun/count"};
  for (const std::string& name : keys) {
    const std::string key = "/temp/vv_search_lun/" + name;
    fakes::on("ktreec_set", key).returns(-1).times(1);
    const size_t before = fakes::writes().size();
    const std::string log =
        fakes::output_of([this] { EXPECT_EQ(ktree_update_search_lun_result(kSocket, &first_, "t"), -103); });
    EXPECT_TRUE(has(log, "ktreec_set(" + key + ") failed"));
    EXPECT_EQ(fakes::writes().back().rfind("set " + key, 0), 0u) << fakes::writes().back();
    EXPECT_GT(fakes::writes().size(), before);
  }
}

TEST_F(SearchResults, TheCodeIsTriedThreeTimes) {
  fakes::on("ktreec_set", "/temp/vv_search_lun/err_code").returns(-1).times(2);
  fakes::output_of([] { EXPECT_EQ(ktree_update_search_lun_err_code(kSocket, 100), 0); });
  EXPECT_EQ(found("err_code"), "100");
  fakes::on("ktreec_set", "/temp/vv_search_lun/err_code").returns(-1);
  fakes::output_of([] { EXPECT_EQ(ktree_update_search_lun_err_code(kSocket, 0), -103); });
  EXPECT_EQ(fakes::writes().size(), 6u);
}

TEST_F(SearchResults, ShareNamesAreComparedWhole) {
  fakes::tree_set({{"/iscsi/initiator/id:1/lun/id:1/share", "Share"},
                   {"/iscsi/initiator/id:3/lun/id:1/share", "other"},
                   {"/iscsi/initiator/id:3/lun/id:2/share", "share"}});
  EXPECT_EQ(ktree_check_duplicate_share_name("Share"), 1);
  EXPECT_EQ(ktree_check_duplicate_share_name("share"), 1);
  EXPECT_EQ(ktree_check_duplicate_share_name("SHARE"), 0);
  EXPECT_EQ(ktree_check_duplicate_share_name("share1"), 0);
  EXPECT_EQ(ktree_check_duplicate_share_name("shar"), 0);
}

TEST_F(SearchResults, TheWalkThroughATargetEndsAtItsFirstGap) {
  fakes::tree_set(
      {{"/iscsi/initiator/id:1/lun/id:1/share", "a"}, {"/iscsi/initiator/id:1/lun/id:3/share", "c"}});
  EXPECT_EQ(ktree_check_duplicate_share_name("c"), 0);
}
