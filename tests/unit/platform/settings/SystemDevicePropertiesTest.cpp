#include "platform/settings/SystemDeviceProperties.h"

#include <sys/utsname.h>

#include "SettingsFolder.h"

namespace tallyd::platform {
namespace {

constexpr std::string_view kQuestions[] = {"UniqueDeviceID", "ProductVersion", "ProductType", "DeviceName",
                                           "HWModelStr",     "SerialNumber",   "ReleaseType"};

class SystemDevicePropertiesTest : public SettingsFolder {
 protected:
  [[nodiscard]] std::optional<std::string> answer(std::string_view question) const {
    return _properties.GNCopyAnswer(question);
  }
  void writeSystem() const {
    write("system/etc/machine-id", "00112233445566778899aabbccddeeff\n");
    write("system/etc/os-release", "VERSION_ID=\"12\"\nBUILD_ID=20240101\n");
    write("system/sys/class/dmi/id/product_name", "Box 3000\n");
    write("system/sys/class/dmi/id/board_name", "Board 7\n");
    write("system/sys/class/dmi/id/product_serial", "S123\n");
    write("system/sys/class/dmi/id/chassis_type", "9\n");
  }

  SystemDeviceProperties _properties{_root, _log, path("system")};
};

TEST_F(SystemDevicePropertiesTest, AnswersFromTheSystem) {
  writeSystem();
  EXPECT_EQ(answer("ProductVersion"), "12");
  EXPECT_EQ(answer("BuildVersion"), "20240101");
  EXPECT_EQ(answer("ProductType"), "Box 3000");
  EXPECT_EQ(answer("HWModelStr"), "Board 7");
  EXPECT_EQ(answer("SerialNumber"), "S123");
  EXPECT_EQ(answer("DeviceName"), "laptop");
  EXPECT_EQ(answer("ReleaseType"), std::nullopt);
  EXPECT_EQ(answer("SomethingElse"), std::nullopt);
  EXPECT_TRUE(_log.lines().empty());
}

TEST_F(SystemDevicePropertiesTest, TheUniqueDeviceIDIsAKeyedDigestOfTheMachineID) {
  writeSystem();
  // printf '%s' 'com.quillon.tallyd UniqueDeviceID' |
  //   openssl dgst -sha256 -mac HMAC -macopt hexkey:00112233445566778899aabbccddeeff
  EXPECT_EQ(answer("UniqueDeviceID"), "072156677202491c0234312f52dddc1e899436df");
  write("system/etc/machine-id", "00112233445566778899aabbccddeefe\n");
  ASSERT_TRUE(answer("UniqueDeviceID"));
  EXPECT_NE(answer("UniqueDeviceID"), "072156677202491c0234312f52dddc1e899436df");
  EXPECT_EQ(answer("UniqueDeviceID")->size(), 40U);
}

TEST_F(SystemDevicePropertiesTest, DeviceTreesAnswerWhereThereIsNoDMI) {
  write("system/sys/firmware/devicetree/base/compatible", std::string("maker,board\0maker,chip\0", 23));
  write("system/sys/firmware/devicetree/base/model", std::string("Maker Board Rev 2\0", 18));
  write("system/sys/firmware/devicetree/base/serial-number", std::string("0001\0", 5));
  EXPECT_EQ(answer("ProductType"), "maker,board");
  EXPECT_EQ(answer("HWModelStr"), "Maker Board Rev 2");
  EXPECT_EQ(answer("SerialNumber"), "0001");
}

TEST_F(SystemDevicePropertiesTest, TheBuildIsElseTheKernelsRelease) {
  utsname names{};
  ASSERT_EQ(::uname(&names), 0);
  EXPECT_EQ(answer("BuildVersion"), names.release);
}

TEST_F(SystemDevicePropertiesTest, ASystemThatSaysNothingHasNoAnswers) {
  for (const std::string_view question : kQuestions) EXPECT_EQ(answer(question), std::nullopt) << question;
}

TEST_F(SystemDevicePropertiesTest, TheConfiguredAnswerComesFirstAndIsReadAfresh) {
  writeSystem();
  Dictionary all;
  for (const std::string_view question : kQuestions) all.set(question, "my " + std::string(question));
  writeList("etc/tally/device.plist", all);
  for (const std::string_view question : kQuestions)
    EXPECT_EQ(answer(question), "my " + std::string(question));
  writeList("etc/tally/device.plist",
            Dictionary{{"ReleaseType", "Internal"}, {"Own", "text"}, {"SerialNumber", 5}});
  EXPECT_EQ(answer("ReleaseType"), "Internal");
  EXPECT_EQ(answer("Own"), "text");
  EXPECT_EQ(answer("SerialNumber"), "S123");
  EXPECT_EQ(answer("ProductVersion"), "12");
  EXPECT_TRUE(_log.lines().empty());
}

TEST_F(SystemDevicePropertiesTest, ABrokenConfigurationIsLoggedOnceAndLeavesTheSystem) {
  writeSystem();
  write("etc/tally/device.plist", "{ broken");
  EXPECT_EQ(answer("ProductVersion"), "12");
  EXPECT_EQ(answer("ProductVersion"), "12");
  ASSERT_EQ(_log.lines().size(), 1U);
  EXPECT_TRUE(_log.hasTextStartingWith(LogLevel::Error,
                                       "Cannot read " + path("etc/tally/device.plist").native() + ": "));
}

TEST_F(SystemDevicePropertiesTest, MachineIdentifiersAreUUIDsOfTheirPurpose) {
  writeSystem();
  const auto first = _properties.machineIdentifier("first purpose");
  ASSERT_TRUE(first);
  // As above, cut to 16 bytes, with the bits of version 4.
  EXPECT_EQ(uuidText(*first), "A6850762-7F0E-41D1-9D3D-EFA306FDA328");
  EXPECT_EQ(_properties.machineIdentifier("first purpose"), first);
  const auto second = _properties.machineIdentifier("second purpose");
  ASSERT_TRUE(second);
  EXPECT_NE(second, first);
  EXPECT_EQ((*second)[6] >> 4, 4);
  EXPECT_EQ((*second)[8] >> 6, 2);
}

TEST_F(SystemDevicePropertiesTest, AMachineWithoutAnIDHasNoIdentifiers) {
  EXPECT_EQ(_properties.machineIdentifier("purpose"), std::nullopt);
  write("system/etc/machine-id", "uninitialized\n");
  EXPECT_EQ(_properties.machineIdentifier("purpose"), std::nullopt);
  EXPECT_EQ(answer("UniqueDeviceID"), std::nullopt);
}

}  // namespace
}  // namespace tallyd::platform
