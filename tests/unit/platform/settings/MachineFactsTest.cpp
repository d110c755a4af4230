#include "platform/settings/MachineFacts.h"

#include "SettingsFolder.h"

namespace tallyd::platform {
namespace {

class MachineFactsTest : public SettingsFolder {
 protected:
  MachineFacts _facts{_folder.path()};
};

TEST_F(MachineFactsTest, ReadsTheMachineID) {
  EXPECT_EQ(_facts.machineID(), std::nullopt);
  write("etc/machine-id", "00112233445566778899aabbccddeeff\n");
  EXPECT_EQ(_facts.machineID(), (MachineID{0x00, 0x11, 0x22, 0x33, 0x44, 0x55, 0x66, 0x77, 0x88, 0x99, 0xAA,
                                           0xBB, 0xCC, 0xDD, 0xEE, 0xFF}));
  write("etc/machine-id", "00112233445566778899aabbccddeef1");
  ASSERT_TRUE(_facts.machineID());
  EXPECT_EQ(_facts.machineID()->back(), 0xF1);
}

TEST_F(MachineFactsTest, RefusesMachineIDsThatAreNone) {
  for (const char* text :
       {"", "\n", "uninitialized\n", "00112233445566778899aabbccddeef", "00112233445566778899aabbccddeefff",
        "00112233445566778899AABBCCDDEEFF", "00112233445566778899aabbccddeefg",
        "00000000000000000000000000000000\n", "00112233445566778899aabbccddeeff\n\n"}) {
    write("etc/machine-id", text);
    EXPECT_EQ(_facts.machineID(), std::nullopt) << text;
  }
}

TEST_F(MachineFactsTest, ReadsOsRelease) {
  write("usr/lib/os-release", "VERSION_ID=1\n");
  EXPECT_EQ(_facts.osRelease("VERSION_ID"), "1");
  write("etc/os-release", "# VERSION_ID=0\nNAME='A b'\nVERSION_ID=\"12.5\"\nBUILD_ID=\n");
  EXPECT_EQ(_facts.osRelease("VERSION_ID"), "12.5");
  EXPECT_EQ(_facts.osRelease("NAME"), "A b");
  EXPECT_EQ(_facts.osRelease("BUILD_ID"), std::nullopt);
  EXPECT_EQ(_facts.osRelease("VERSION"), std::nullopt);
}

TEST_F(MachineFactsTest, ResolvesShellQuoting) {
  EXPECT_EQ(shellVariable("A=x", "A"), "x");
  EXPECT_EQ(shellVariable("  A=x # comment\n", "A"), "x");
  EXPECT_EQ(shellVariable("A=\"a \\\"b\\\" \\$c\"", "A"), "a \"b\" $c");
  EXPECT_EQ(shellVariable("A='a \\b'", "A"), "a \\b");
  EXPECT_EQ(shellVariable("A=a\\ b", "A"), "a b");
  EXPECT_EQ(shellVariable("A=1\nA=2\n", "A"), "2");
  EXPECT_EQ(shellVariable("A=\"\"", "A"), std::nullopt);
  EXPECT_EQ(shellVariable("AB=1\nXA=2\nA =3", "A"), std::nullopt);
  EXPECT_EQ(shellVariable("A='open", "A"), "open");
  EXPECT_EQ(shellVariable("A=\xFF", "A"), "\uFFFD");
}

TEST_F(MachineFactsTest, ReadsDMIAndTheDeviceTree) {
  write("sys/class/dmi/id/product_name", "  Box 3000 \n");
  write("sys/class/dmi/id/board_name", "To Be Filled By O.E.M.\n");
  write("sys/class/dmi/id/product_serial", "\n");
  write("sys/firmware/devicetree/base/compatible", std::string("maker,board\0maker,chip\0", 23));
  EXPECT_EQ(_facts.dmi("product_name"), "Box 3000");
  EXPECT_EQ(_facts.dmi("board_name"), std::nullopt);
  EXPECT_EQ(_facts.dmi("product_serial"), std::nullopt);
  EXPECT_EQ(_facts.dmi("missing"), std::nullopt);
  EXPECT_EQ(_facts.deviceTree("compatible"), "maker,board");
  EXPECT_EQ(_facts.deviceTree("model"), std::nullopt);
}

TEST_F(MachineFactsTest, TellsTheKindOfChassis) {
  EXPECT_EQ(_facts.chassis(), std::nullopt);
  for (const auto& [kind, name] : {std::pair("3\n", "desktop"),
                                   {"10\n", "laptop"},
                                   {"11\n", "handset"},
                                   {"17\n", "server"},
                                   {"23\n", "server"},
                                   {"30\n", "tablet"},
                                   {"31\n", "convertible"},
                                   {"34\n", "embedded"}}) {
    write("sys/class/dmi/id/chassis_type", kind);
    EXPECT_EQ(_facts.chassis(), name) << kind;
  }
  for (const char* kind : {"1\n", "2\n", "99\n", "x\n"}) {
    write("sys/class/dmi/id/chassis_type", kind);
    EXPECT_EQ(_facts.chassis(), std::nullopt) << kind;
  }
  write("sys/firmware/devicetree/base/chassis-type", std::string("handset\0", 8));
  EXPECT_EQ(_facts.chassis(), "handset");
  write("etc/machine-info", "PRETTY_HOSTNAME=x\nCHASSIS=watch\n");
  EXPECT_EQ(_facts.chassis(), "watch");
}

}  // namespace
}  // namespace tallyd::platform
