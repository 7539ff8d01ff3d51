#include "platform/system/SystemDeviceAnswers.h"

#include <gtest/gtest.h>
#include <sys/utsname.h>

#include "platform/PropertyList.h"
#include "tests/platform/system/Expect.h"
#include "tests/support/RecordingLog.h"
#include "tests/support/ScratchFolder.h"

namespace telvane {
namespace {

using telvane::testing::RecordingLog;
using telvane::testing::textOf;

class SystemDeviceAnswersTest : public ::testing::Test {
 protected:
  SystemDeviceAnswersTest() { ::uname(&_kernel); }

  void givenOverrides(const Value& content) {
    _folder.write("root/etc/telvane/device.plist", propertylist::serialize(content, propertylist::Format::XML)->view());
  }
  std::string answer(const Key& key) {
    return textOf(
        SystemDeviceAnswers(Paths{.root = _folder.at("root"), .home = ""}, _log, _folder.at("machine")).answer(key));
  }

  testing::ScratchFolder _folder;
  RecordingLog _log;
  utsname _kernel{};
};

TEST_F(SystemDeviceAnswersTest, readsTheReleaseFile) {
  _folder.write("machine/etc/os-release", "NAME=\"X\"\nVERSION_ID=\"12\"\n BUILD_ID='20240501'\nMY_VERSION_ID=no\n");
  EXPECT_EQ(answer(DeviceAnswers::kProductVersion), "12");
  EXPECT_EQ(answer(DeviceAnswers::kBuildVersion), "20240501");
}

TEST_F(SystemDeviceAnswersTest, readsTheReleaseFileOfTheVendorWhenTheMachineHasNone) {
  _folder.write("machine/usr/lib/os-release", "VERSION_ID=3.4");
  EXPECT_EQ(answer(DeviceAnswers::kProductVersion), "3.4");
}

TEST_F(SystemDeviceAnswersTest, fallsBackToWhatTheKernelTells) {
  EXPECT_EQ(answer(DeviceAnswers::kProductVersion), _kernel.release);
  EXPECT_EQ(answer(DeviceAnswers::kBuildVersion), _kernel.release);
  EXPECT_EQ(answer(DeviceAnswers::kHWModelStr), _kernel.machine);
  EXPECT_EQ(answer(DeviceAnswers::kProductType), "Linux");
  EXPECT_EQ(answer(DeviceAnswers::kDeviceName), "Linux");
  EXPECT_EQ(answer(DeviceAnswers::kSerialNumber), "unknown");
  EXPECT_EQ(answer(DeviceAnswers::kReleaseType), "(none)");
}

TEST_F(SystemDeviceAnswersTest, readsWhatTheFirmwareTells) {
  _folder.write("machine/sys/class/dmi/id/product_name", "Board Nine\n");
  _folder.write("machine/sys/class/dmi/id/product_family", " Nine Family \n");
  _folder.write("machine/sys/class/dmi/id/board_name", "B9-1\n");
  _folder.write("machine/sys/class/dmi/id/product_serial", "SN123\n");
  EXPECT_EQ(answer(DeviceAnswers::kProductType), "Board Nine");
  EXPECT_EQ(answer(DeviceAnswers::kDeviceName), "Nine Family");
  EXPECT_EQ(answer(DeviceAnswers::kHWModelStr), "B9-1");
  EXPECT_EQ(answer(DeviceAnswers::kSerialNumber), "SN123");
}

TEST_F(SystemDeviceAnswersTest, readsTheDeviceTreeOfAMachineWithoutDMI) {
  _folder.write("machine/proc/device-tree/compatible", std::string_view("maker,board-4\0maker,soc\0", 24));
  _folder.write("machine/proc/device-tree/model", std::string_view("Maker Board 4\0", 14));
  _folder.write("machine/proc/device-tree/serial-number", std::string_view("10000000abcd\0", 13));
  EXPECT_EQ(answer(DeviceAnswers::kProductType), "maker,board-4");
  EXPECT_EQ(answer(DeviceAnswers::kHWModelStr), "Maker Board 4");
  EXPECT_EQ(answer(DeviceAnswers::kSerialNumber), "10000000abcd");
}

TEST_F(SystemDeviceAnswersTest, passesOverWhatMakersDidNotFillIn) {
  _folder.write("machine/sys/class/dmi/id/product_name", "To Be Filled By O.E.M.\n");
  _folder.write("machine/sys/class/dmi/id/product_serial", "\n");
  _folder.write("machine/sys/class/dmi/id/board_name", std::string(300, 'x'));
  EXPECT_EQ(answer(DeviceAnswers::kProductType), "Linux");
  EXPECT_EQ(answer(DeviceAnswers::kSerialNumber), "unknown");
  EXPECT_EQ(answer(DeviceAnswers::kHWModelStr), _kernel.machine);
}

TEST_F(SystemDeviceAnswersTest, derivesAnIdentifierThatDoesNotShowTheMachineID) {
  _folder.write("machine/etc/machine-id", "0123456789abcdef0123456789abcdef\n");
  const std::string identifier = answer(DeviceAnswers::kUniqueDeviceID);
  // HMAC-SHA256 of "Telvane UniqueDeviceID 1" with the 16 bytes as key, first 20 bytes.
  EXPECT_EQ(identifier, "119940fb44f6130da56f8d86d34a83795d1917a1");
  EXPECT_EQ(identifier.find("0123456789abcdef"), std::string::npos);
  _folder.write("machine/etc/machine-id", "0123456789abcdef0123456789abcdee\n");
  EXPECT_NE(answer(DeviceAnswers::kUniqueDeviceID), identifier);
}

TEST_F(SystemDeviceAnswersTest, hasNoIdentifierWithoutAMachineID) {
  EXPECT_EQ(answer(DeviceAnswers::kUniqueDeviceID), "(none)");
  for (const char* text : {"uninitialized\n", "", "0123456789abcdef0123456789abcdeg", "0123456789abcdef"}) {
    _folder.write("machine/etc/machine-id", text);
    EXPECT_EQ(answer(DeviceAnswers::kUniqueDeviceID), "(none)") << text;
  }
}

TEST_F(SystemDeviceAnswersTest, letsTheFileSayEveryAnswer) {
  _folder.write("machine/etc/machine-id", "0123456789abcdef0123456789abcdef\n");
  Dictionary overrides;
  const Key keys[] = {DeviceAnswers::kUniqueDeviceID, DeviceAnswers::kProductVersion, DeviceAnswers::kBuildVersion,
                      DeviceAnswers::kHWModelStr,     DeviceAnswers::kSerialNumber,   DeviceAnswers::kProductType,
                      DeviceAnswers::kDeviceName,     DeviceAnswers::kReleaseType};
  for (const Key& key : keys) overrides.set(key, "my " + std::string(key.view()));
  givenOverrides(overrides);
  for (const Key& key : keys) EXPECT_EQ(answer(key), "my " + std::string(key.view()));
}

TEST_F(SystemDeviceAnswersTest, countsAnOverrideOfAWrongTypeAsAbsentWithOneErrorLine) {
  _folder.write("machine/etc/os-release", "VERSION_ID=12\n");
  givenOverrides(Dictionary{{DeviceAnswers::kProductVersion, 13}, {DeviceAnswers::kReleaseType, "Internal"}});
  _log.expectError("no text for ProductVersion");
  const SystemDeviceAnswers answers(Paths{.root = _folder.at("root"), .home = ""}, _log, _folder.at("machine"));
  EXPECT_EQ(textOf(answers.answer(DeviceAnswers::kProductVersion)), "12");
  EXPECT_EQ(textOf(answers.answer(DeviceAnswers::kProductVersion)), "12");
  EXPECT_EQ(textOf(answers.answer(DeviceAnswers::kReleaseType)), "Internal");
  EXPECT_EQ(_log.count(LogLevel::Error, ""), 1u);
}

TEST_F(SystemDeviceAnswersTest, countsAGarbageFileAsAbsentWithOneErrorLine) {
  _folder.write("root/etc/telvane/device.plist", "garbage");
  _log.expectError("device.plist counts as empty");
  EXPECT_EQ(answer(DeviceAnswers::kProductType), "Linux");
  EXPECT_EQ(_log.count(LogLevel::Error, ""), 1u);
}

}  // namespace
}  // namespace telvane
