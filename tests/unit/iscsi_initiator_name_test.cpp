// The initiator's name from address texts that no port of ours gives.
#include "fakes.h"
#include "frontend/log.h"
#include "iscsi/initiator_name.h"
#include "support/lan.h"

namespace {
const char* mac_text = nullptr;  // null: the port has no address
}

// In place of the real ports.
namespace remvol {

int get_lan0_mac_text(char* text) {
  if (mac_text == nullptr) return -1;
  snprintf(text, 32, "%s", mac_text);
  return 0;
}

int get_lan1_mac_text(char*) {
  return -1;
}

int is_lan0_linked() {
  return 0;
}

int is_lan1_linked() {
  return 0;
}

namespace {

class InitiatorName : public fakes::Test {
 protected:
  InitiatorName() { fakes::on("sys_hostname").text("Box"); }

  // The result, the name and what was logged.
  static std::string unique_name(const char* mac) {
    mac_text = mac;
    char name[7] = "before";
    int result = 0;
    const std::string said = messages([&] { result = get_mac_as_unique_name(name); });
    return std::to_string(result) + " " + name + (said.empty() ? "" : " " + said);
  }
};

TEST_F(InitiatorName, LastThreeOctetsInLowerCase) {
  EXPECT_EQ(unique_name("00:90:A9:1B:2C:3D"), "0 1b2c3d");
  EXPECT_EQ(unique_name("00:90:a9:00:FF:99"), "0 00ff99");
}

TEST_F(InitiatorName, NoAddress) {
  EXPECT_EQ(unique_name(nullptr), "-1 before ERROR : get lan1 mac from ktree failed\n");
}

TEST_F(InitiatorName, OtherCharactersEndTheName) {
  EXPECT_EQ(unique_name("00:90:A9:1B:2C.3D"), "-1 1b2c error : unique_name = 1b2c\n");
  EXPECT_EQ(unique_name("00:90:A9: B:2C:3D"), "-1  error : unique_name = \n");
}

TEST_F(InitiatorName, WrongNumberOfDigits) {
  EXPECT_EQ(unique_name("00:90:A9:1B::C:3D"), "-1 1bc3d error : unique_name = 1bc3d\n");
  EXPECT_EQ(unique_name("00:90:A9:1B2C3D4E"), "-1 1b2c3d error : unique_name = 1b2c3d4e\n");
}

TEST_F(InitiatorName, TextOfAnotherLengthIsLeftAlone) {
  EXPECT_EQ(unique_name("00:90:A9:1B:2C:3"), "0 before");
  EXPECT_EQ(unique_name("00:90:A9:1B:2C:3D\n"), "0 before");
  EXPECT_EQ(unique_name(""), "0 before");
}

TEST_F(InitiatorName, NothingToPutTheNameInto) {
  mac_text = "00:90:A9:1B:2C:3D";
  EXPECT_EQ(get_mac_as_unique_name(nullptr), 0);
}

TEST_F(InitiatorName, MalformedAddressLeavesTheUniquePartOut) {
  mac_text = "00:90:A9:1B:2C:?D";
  std::string name;
  const std::string output = fakes::output_of([&] { name = make_initiator_name().c_str(); });
  EXPECT_EQ(name, "iqn.2013-03.org.example:box:initiator");
  debug_level = 1;
  const std::string detailed = fakes::output_of([] { (void)make_initiator_name(); });
  debug_level = 0;
  EXPECT_TRUE(has(detailed, "get_mac_as_unique_name failed"));
}

TEST_F(InitiatorName, LowerCase) {
  char text[] = "NAS-Box_09\xC4";
  str_to_lower(text);
  EXPECT_STREQ(text, "nas-box_09\xC4");
}

}  // namespace
}  // namespace remvol
