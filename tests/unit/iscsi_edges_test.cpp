// Arguments and answers that the commands themselves never meet.
#include <fstream>

#include "fakes.h"
#include "iscsi/discovery.h"
#include "iscsi/iface.h"
#include "iscsi/node.h"
#include "iscsi/session.h"
#include "iscsi/session_check.h"
#include "iscsi/target_status.h"
#include "support/program.h"
#include "support/result.h"
#include "support/text.h"
#include "tasks/whole_target.h"

namespace remvol {
namespace {

using Texts = std::vector<std::string>;

constexpr char kTarget[] = "iqn.t1";

Result make_no_node(const char*) {
  return kOk;
}

class Iscsi : public fakes::Test {
 protected:
  Iscsi() { snprintf(program_path, sizeof program_path, "/usr/bin/unit%d", getpid()); }

  static TargetEntry entry(const char* ip = "10.0.0.1", int port = 3260) {
    TargetEntry made = {};
    copy_text(made.target_name, kTarget);
    copy_text(made.ip, ip);
    made.port = port;
    return made;
  }

  // Every listing command writes `text` to where it is sent.
  static void listing(const std::string& text) {
    fakes::on("system", fakes::Expression{"^iscsiadm -m session"}).does([text] {
      const std::string command = fakes::commands().back();
      const size_t from = command.find('>') + 1;
      std::ofstream(command.substr(from, command.find(' ', from) - from)) << text;
    });
  }
};

TEST_F(Iscsi, CheckOfNoName) {
  EXPECT_EQ(check_target_connected(nullptr), -1);
  EXPECT_EQ(check_target_connected(""), -1);
  EXPECT_EQ(fakes::calls(), Texts{});
}

TEST_F(Iscsi, WaitOfNoName) {
  EXPECT_EQ(messages([] { EXPECT_EQ(_wait_sess_lun_ready(nullptr, 3), -1); }), "parameter error\n");
  EXPECT_EQ(messages([] { EXPECT_EQ(_wait_sess_lun_ready("", 3), -1); }), "target name error\n");
}

TEST_F(Iscsi, WaitOfNoSecondsPollsOnce) {
  listing("Target: iqn.other\n");
  EXPECT_EQ(_wait_sess_lun_ready(kTarget, 0), 1);
  EXPECT_EQ(fakes::calls({"usleep"}), Texts{"usleep 100000"});
  EXPECT_EQ(fakes::commands().size(), 1u);
}

TEST_F(Iscsi, WaitOfOneSecondPollsTenTimes) {
  listing("");
  EXPECT_EQ(_wait_sess_lun_ready(kTarget, 1), 1);
  EXPECT_EQ(fakes::calls({"usleep"}).size(), 10u);
}

TEST_F(Iscsi, WaitOfLessThanNothingDoesNotPoll) {
  EXPECT_EQ(_wait_sess_lun_ready(kTarget, -1), 1);
  EXPECT_EQ(fakes::calls(), Texts{});
}

TEST_F(Iscsi, ListOfNothing) {
  LunNode* head = nullptr;
  EXPECT_EQ(messages([] { EXPECT_EQ(_get_sess_lun_list(nullptr, kTarget, make_no_node), -1); }),
            "parameter error\n");
  EXPECT_EQ(messages([&] { EXPECT_EQ(_get_sess_lun_list(&head, nullptr, make_no_node), -1); }),
            "parameter error\n");
  EXPECT_EQ(messages([&] { EXPECT_EQ(_get_sess_lun_list(&head, "", make_no_node), -1); }),
            "target name error\n");
}

TEST_F(Iscsi, ListWithoutAnySessionLeavesTheHead) {
  LunNode node = {};
  LunNode* head = &node;
  fakes::on("system").returns(21 << 8);
  EXPECT_EQ(_get_sess_lun_list(&head, kTarget, make_no_node), 0);
  EXPECT_EQ(head, &node);
}

TEST_F(Iscsi, ListThatIsEmptyReplacesTheHead) {
  LunNode node = {};
  LunNode* head = &node;
  listing("Target: iqn.other\n");
  EXPECT_EQ(_get_sess_lun_list(&head, kTarget, make_no_node), 0);
  EXPECT_EQ(head, nullptr);
}

TEST_F(Iscsi, ListForNobodyIsNotPrinted) {
  EXPECT_EQ(fakes::output_of([] { print_lun_list(nullptr, nullptr); }), "");
}

TEST_F(Iscsi, CleaningFindsTheSlotByName) {
  fakes::tree_set({{"/iscsi/initiator/id:1/target", "iqn.t0"},
                   {"/iscsi/initiator/id:2/target", kTarget},
                   {"/iscsi/initiator/id:2/lun/id:1/lun", "0"},
                   {"/iscsi/initiator/id:2/lun/id:1/dev", "sdb"}});
  TargetEntry known = entry();
  EXPECT_EQ(ktree_clean_target_dev(&known), 0);
  EXPECT_EQ(fakes::tree_get("/iscsi/initiator/id:2/lun/id:1/dev"), "");
}

TEST_F(Iscsi, CleaningOfNoTarget) {
  TargetEntry unknown = entry();
  TargetEntry nameless = {};
  EXPECT_EQ(ktree_clean_target_dev(nullptr), -1);
  EXPECT_EQ(ktree_clean_target_dev(&nameless), -1);
  EXPECT_EQ(ktree_clean_target_dev(&unknown), -1);
}

TEST_F(Iscsi, CleaningGoesOnAfterAFailedWrite) {
  for (const char* slot : {"1", "2"}) {
    const std::string lun = std::string("/iscsi/initiator/id:1/lun/id:") + slot;
    fakes::tree_set({{lun + "/lun", slot}, {lun + "/dev", "sdb"}});
  }
  fakes::on("ktreec_set", "/iscsi/initiator/id:1/lun/id:1/dev").returns(-1);
  TargetEntry first = entry();
  first.db_idx = 1;
  EXPECT_EQ(messages([&] { EXPECT_EQ(ktree_clean_target_dev(&first), -103); }), "ktreec_set() failed\n");
  EXPECT_EQ(fakes::tree_get("/iscsi/initiator/id:1/lun/id:2/dev"), "");
}

TEST_F(Iscsi, LastUsableLunStaysInTheEntry) {
  fakes::tree_set({{"/iscsi/initiator/id:1/lun/id:1/lun", "5"}, {"/iscsi/initiator/id:1/lun/id:2/lun", "6"}});
  listing(
      "Target: iqn.t1\niSCSI Session State: LOGGED_IN\nLun: 6\nAttached scsi disk sdb\trunning\n"
      "Lun: 5\nAttached scsi disk sdc\trunning\nLun: 7\nAttached scsi disk sdd\trunning\n");
  TargetEntry first = entry();
  first.db_idx = 1;
  EXPECT_EQ(ktree_update_dev(&first), 0);
  EXPECT_STREQ(first.dev, "sdc");
  EXPECT_EQ(fakes::tree_get("/iscsi/initiator/id:1/lun/id:2/dev"), "sdb");
}

TEST_F(Iscsi, DisksOfLunsThatAreNotStoredAreNone) {
  fakes::tree_set({{"/iscsi/initiator/id:1/lun/id:1/lun", "5"}});
  listing("Target: iqn.t1\niSCSI Session State: LOGGED_IN\nLun: 6\nAttached scsi disk sdb\trunning\n");
  TargetEntry first = entry();
  first.db_idx = 1;
  EXPECT_EQ(ktree_update_dev(&first), kNoRunningDisk);
  EXPECT_STREQ(first.dev, "");
}

TEST_F(Iscsi, UpdateOfNoEntry) {
  listing("");
  EXPECT_EQ(messages([] { EXPECT_EQ(ktree_update_dev(nullptr), -1); }),
            "ktree_clean_target_dev for  failed\n");
}

TEST_F(Iscsi, InterfaceOfNothing) {
  char out[8] = "before";
  EXPECT_EQ(_get_iface_name(nullptr, sizeof out, "10.0.0.1"), -1);
  EXPECT_EQ(_get_iface_name(out, 0, "10.0.0.1"), -1);
  EXPECT_EQ(_get_iface_name(out, sizeof out, nullptr), -1);
  EXPECT_STREQ(out, "before");
}

TEST_F(Iscsi, InterfaceOfAnEmptyAddressIsTheDefault) {
  char out[32] = "before";
  EXPECT_EQ(_get_iface_name(out, sizeof out, ""), 0);
  EXPECT_STREQ(out, "default");
}

TEST_F(Iscsi, InterfaceIsCutToItsBuffer) {
  char out[4];
  EXPECT_EQ(_get_iface_name(out, sizeof out, "10.0.0.1"), 0);
  EXPECT_STREQ(out, "def");
}

TEST_F(Iscsi, InterfaceOfAnEntryIsChosenOnce) {
  TargetEntry chosen = entry("[fe80::1]");
  copy_text(chosen.iface, "iface7");
  EXPECT_EQ(get_iface_name(&chosen), 0);
  EXPECT_STREQ(chosen.iface, "iface7");
  TargetEntry nowhere = entry("");
  EXPECT_EQ(get_iface_name(nullptr), -1);
  EXPECT_EQ(get_iface_name(&nowhere), -1);
}

TEST_F(Iscsi, RecordOfNoEntry) {
  TargetEntry nowhere = entry("");
  EXPECT_EQ(Target_Config_Gen(nullptr), -1);
  EXPECT_EQ(Target_Config_Gen(&nowhere), -1);
  EXPECT_EQ(delete_node_record(nullptr), -1);
  EXPECT_EQ(delete_node_record(&nowhere), -1);
  EXPECT_EQ(fakes::calls(), Texts{});
}

TEST_F(Iscsi, RecordIsDeletedOnItsOwn) {
  TargetEntry known = entry();
  const std::string command = "iscsiadm -m node -I default -T iqn.t1 -p 10.0.0.1:3260 -o delete";
  fakes::on("system", command).returns(21 << 8);
  EXPECT_EQ(messages([&] { EXPECT_EQ(delete_node_record(&known), 0); }),
            "system() of cmd '" + command + "' failed\n");
  EXPECT_EQ(fakes::commands(), Texts{command});
}

TEST_F(Iscsi, LoginOutsideThePorts) {
  for (const int port : {0, 65536, -1}) {
    TargetEntry target = entry("10.0.0.1", port);
    EXPECT_EQ(_target_login(&target, kTarget), -1) << port;
  }
  TargetEntry nowhere = entry("");
  EXPECT_EQ(_target_login(&nowhere, kTarget), -1);
  EXPECT_EQ(_target_login(nullptr, kTarget), -1);
  EXPECT_EQ(fakes::calls(), Texts{});
}

TEST_F(Iscsi, PlainLogoutNeedsAName) {
  TargetEntry nameless = {};
  EXPECT_EQ(messages([&] { EXPECT_EQ(_target_disconnect(&nameless), -1); }), "parameter error\n");
  EXPECT_EQ(fakes::calls(), Texts{});
}

TEST_F(Iscsi, PlainLogoutChangesNothingElse) {
  const TargetEntry known = entry();
  EXPECT_EQ(_target_disconnect(&known), 0);
  fakes::on("system").returns(256);
  EXPECT_EQ(_target_disconnect(&known), 1);
  EXPECT_EQ(fakes::commands(), Texts(2, "iscsiadm -m node -T \"iqn.t1\" --logout"));
  EXPECT_EQ(fakes::writes(), Texts{});
}

TEST_F(Iscsi, LogoutOfNoNameIsTried) {
  TargetEntry nameless = {};
  nameless.db_idx = 3;
  nameless.conn_set = 1;
  EXPECT_EQ(Target_Logout(&nameless), 0);
  EXPECT_EQ(fakes::commands(), Texts{"iscsiadm -m node -T \"\" --logout"});
  EXPECT_EQ(fakes::writes(), Texts{"set /iscsi/initiator/id:3/conn_state=0"});
  EXPECT_EQ(nameless.conn_set, 0);
}

TEST_F(Iscsi, DisconnectOfAnUnknownTarget) {
  TargetEntry unknown = entry();
  EXPECT_EQ(messages([&] { EXPECT_EQ(Target_Disconnect(&unknown), -1); }),
            "target : iqn.t1  does not exist in ktree\n");
  EXPECT_EQ(fakes::commands(), Texts{});
}

TEST_F(Iscsi, DisconnectFindsTheSlotByName) {
  fakes::tree_set({{"/iscsi/initiator/id:1/target", kTarget}});
  fakes::on("system", "iscsiadm -m node -T \"iqn.t1\" --logout").returns(256);
  TargetEntry known = entry();
  EXPECT_EQ(Target_Disconnect(&known), 1);
  EXPECT_EQ(known.db_idx, 1);
  EXPECT_EQ(fakes::tree_get("/iscsi/initiator/id:1/conn_set"), "0");
}

TEST_F(Iscsi, TheStatusOfATargetWithoutASlotIsRefusedByTheTree) {
  const TargetEntry nobody = {};
  const std::string status = "ktreec_set(/iscsi/initiator/id:0/status) failed\n";
  EXPECT_EQ(messages([&] { EXPECT_EQ(ktree_update_status(&nobody), -103); }),
            status + status + status +
                "ktreec_set(/iscsi/initiator/id:0/conn_state) failed\n"
                "ktree_set_connect_state(0, 0) failed\n");
}

TEST_F(Iscsi, OfferOfNothing) {
  const auto asks = [](const char* name, const char* address, int port, const char* text) {
    EXPECT_EQ(messages([=] { EXPECT_EQ(Portal_search_target(name, address, port), -1); }), text);
  };
  asks(nullptr, "10.0.0.1", 3260, "target name or ip is not given\n");
  asks(kTarget, nullptr, 3260, "target name or ip is not given\n");
  asks("", "10.0.0.1", 3260, "target_name or ip is not valid\n");
  asks(kTarget, "", 3260, "target_name or ip is not valid\n");
  asks(kTarget, "10.0.0.1", 0, "Port is not valid\n");
  asks(kTarget, "10.0.0.1", 65536, "Port is not valid\n");
}

TEST_F(Iscsi, OfferAfterAFailedCheckIsTakenForConnected) {
  fakes::on("system").returns(4 << 8);
  EXPECT_EQ(Portal_search_target(kTarget, "10.0.0.1", 3260), 2);
}

}  // namespace
}  // namespace remvol
