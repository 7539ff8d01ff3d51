// Adaptors as their authors build them: real shared objects, from tests/support/adaptors.
#include "platform/system/LoadedWirelessDiagnostics.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <memory>
#include <thread>

#include "platform/PropertyList.h"
#include "tests/platform/system/Expect.h"
#include "tests/support/Matchers.h"
#include "tests/support/RecordingLog.h"
#include "tests/support/ScratchFolder.h"

namespace telvane::testing {
namespace {

namespace fs = std::filesystem;

constexpr char kBundle[] = "/System/Frameworks/Service.framework";
constexpr char kFolder[] = "root/System/Frameworks/Service.framework";
constexpr char kObject[] = "root/System/Frameworks/Service.framework/Service";
constexpr char kSelector[] = "sendMessageWithMethod:respCode:dict:";

class LoadedWirelessDiagnosticsTest : public ::testing::Test {
 protected:
  void givenAdaptor(const std::string& name) {
    fs::create_directories(_folder.at(kFolder));
    fs::copy_file(std::string(TELVANE_TEST_ADAPTORS) + "/" + name + ".so", _folder.at(kObject));
  }
  std::unique_ptr<WirelessDiagnosticsBundle> open() { return _diagnostics.openBundleAtPath(kBundle); }
  std::unique_ptr<WirelessDiagnosticsAdaptor> newAdaptor(const char* className = "VDRAdaptor") {
    const auto bundle = open();
    return bundle != nullptr ? bundle->newInstanceOfClass(className) : nullptr;
  }
  std::string object() const { return _folder.at(kObject); }
  Value received(const std::string& file) {
    const Result<Value> message = propertylist::parse(Data(_folder.read(kFolder + ("/" + file))));
    return message.has_value() ? *message : Value();
  }
  std::string life() { return _folder.read(std::string(kFolder) + "/life"); }

  ScratchFolder _folder;
  RecordingLog _log;
  LoadedWirelessDiagnostics _diagnostics{Paths{.root = _folder.at("root"), .home = _folder.at("home")}, _log};
};

TEST_F(LoadedWirelessDiagnosticsTest, aDeviceWithoutTheBundleIsNoError) {
  EXPECT_EQ(open(), nullptr);
  EXPECT_EQ(_log.count(LogLevel::Default, "openBundleAtPath: There is no bundle " + _folder.at(kFolder)), 1u);
}

TEST_F(LoadedWirelessDiagnosticsTest, aFileInTheBundlesPlaceIsNoBundle) {
  _folder.write(kFolder, "text");
  EXPECT_EQ(open(), nullptr);
  EXPECT_EQ(_log.count(LogLevel::Default, "openBundleAtPath: There is no bundle"), 1u);
}

TEST_F(LoadedWirelessDiagnosticsTest, aBundleWithoutItsSharedObjectIsAnError) {
  fs::create_directories(_folder.at(kFolder));
  _folder.write(std::string(kFolder) + "/libService.so", "another name");
  _log.expectError("openBundleAtPath: The bundle has no shared object " + object());
  EXPECT_EQ(open(), nullptr);
}

// The loader would wait until somebody writes into it.
TEST_F(LoadedWirelessDiagnosticsTest, aPipeInTheSharedObjectsPlaceIsNotWaitedFor) {
  fs::create_directories(_folder.at(kFolder));
  ASSERT_EQ(::mkfifo(object().c_str(), 0600), 0);
  _log.expectError("openBundleAtPath: The bundle has no shared object " + object());
  EXPECT_EQ(open(), nullptr);
}

TEST_F(LoadedWirelessDiagnosticsTest, whatIsNoSharedObjectCannotBeLoaded) {
  _folder.write(kObject, "#!/bin/sh\n");
  _log.expectError("openBundleAtPath: " + object() + " cannot be loaded: ");
  EXPECT_EQ(open(), nullptr);
}

TEST_F(LoadedWirelessDiagnosticsTest, aSharedObjectThatLacksAFunctionOfOthersCannotBeLoaded) {
  givenAdaptor("UnresolvedAdaptor");
  _log.expectError("undefined symbol: nobodyHasThisFunction");
  EXPECT_EQ(open(), nullptr);
  EXPECT_EQ(_log.count(LogLevel::Error, object() + " cannot be loaded: "), 1u);
}

TEST_F(LoadedWirelessDiagnosticsTest, aSharedObjectThatIsNoAdaptorLacksFunctionsThatAreNamed) {
  givenAdaptor("IncompleteAdaptor");
  _log.expectError("openBundleAtPath: " + object() +
                   " is no adaptor, it does not export TelvaneVDRAdaptorRespondsToSelector, "
                   "TelvaneVDRAdaptorSendMessage");
  EXPECT_EQ(open(), nullptr);
}

TEST_F(LoadedWirelessDiagnosticsTest, anAdaptorOfAnotherVersionIsNotCalled) {
  givenAdaptor("OtherVersionAdaptor");
  _log.expectError("openBundleAtPath: " + object() + " is an adaptor of version 2, and only version 1 can be called");
  EXPECT_EQ(open(), nullptr);
  EXPECT_EQ(life(), "");
}

TEST_F(LoadedWirelessDiagnosticsTest, aMissingClassIsAnError) {
  givenAdaptor("RecordingAdaptor");
  const auto bundle = open();
  ASSERT_NE(bundle, nullptr);
  _log.expectError("newInstanceOfClass: " + object() + " has no class AnotherAdaptor");
  EXPECT_EQ(bundle->newInstanceOfClass("AnotherAdaptor"), nullptr);
  EXPECT_EQ(life(), "");
}

TEST_F(LoadedWirelessDiagnosticsTest, handsMessagesOver) {
  givenAdaptor("RecordingAdaptor");
  const auto adaptor = newAdaptor();
  ASSERT_NE(adaptor, nullptr);
  EXPECT_EQ(adaptor->description(), "<VDRAdaptor of " + object() + ">");
  ASSERT_TRUE(adaptor->respondsTo(kSelector));
  EXPECT_FALSE(adaptor->respondsTo("sendMessageWithMethod:respCode:"));
  const Dictionary dict{{Key("text"), "Grüße"},
                        {Key("number"), -5},
                        {Key("real"), 2.5},
                        {Key("yes"), true},
                        {Key("data"), Data("\x01\x02")},
                        {Key("deep"), Dictionary{{Key("list"), Array{1, Array{}, "two"}}}}};
  adaptor->sendMessageWithMethod(65535, 0, dict);
  adaptor->sendMessageWithMethod(0, 65535, {});
  EXPECT_EQ(received("message-1.plist"),
            Value(Dictionary{{Key("instance"), 1}, {Key("method"), 65535}, {Key("respCode"), 0}, {Key("dict"), dict}}));
  EXPECT_EQ(received("message-2.plist"),
            Value(Dictionary{
                {Key("instance"), 1}, {Key("method"), 0}, {Key("respCode"), 65535}, {Key("dict"), Dictionary()}}));
  EXPECT_EQ(_log.undeclared(), "");
}

TEST_F(LoadedWirelessDiagnosticsTest, givesEachInstanceBackOnceAndMayBeOpenedAgain) {
  givenAdaptor("RecordingAdaptor");
  auto one = newAdaptor();
  auto other = newAdaptor();
  ASSERT_TRUE(one != nullptr && other != nullptr);
  EXPECT_EQ(life(), "create 1\ncreate 2\n");
  one.reset();
  EXPECT_EQ(life(), "create 1\ncreate 2\nrelease 1\n");
  other->sendMessageWithMethod(1, 1, {});
  EXPECT_EQ(received("message-1.plist").dictionary() != nullptr, true);
  other.reset();
  EXPECT_NE(newAdaptor(), nullptr) << "the code stays loaded, and goes on counting";
  EXPECT_EQ(life(), "create 1\ncreate 2\nrelease 1\nrelease 2\ncreate 3\nrelease 3\n");
}

TEST_F(LoadedWirelessDiagnosticsTest, whatAnAdaptorThrowsEndsInTheLog) {
  givenAdaptor("ThrowingAdaptor");
  auto adaptor = newAdaptor();
  ASSERT_NE(adaptor, nullptr);
  _log.expectError("TelvaneVDRAdaptorSendMessage of " + object() + " threw an exception: no service");
  _log.expectError("TelvaneVDRAdaptorSendMessage of " + object() + " threw an exception of a kind of its own");
  adaptor->sendMessageWithMethod(7, 2, {});
  adaptor->sendMessageWithMethod(1, 2, {});
  _log.expectError("TelvaneVDRAdaptorRespondsToSelector of " + object() + " threw an exception");
  EXPECT_TRUE(adaptor->respondsTo(kSelector));
  EXPECT_FALSE(adaptor->respondsTo("unknown"));
  _log.expectError("TelvaneVDRAdaptorRelease of " + object() + " threw an exception: released too often");
  adaptor.reset();
}

// Caught and not passed on, the runtime's own way to end a thread would end the process without a word.
TEST_F(LoadedWirelessDiagnosticsTest, anAdaptorThatEndsItsThreadIsNamedAndTheThreadGoes) {
  givenAdaptor("ThrowingAdaptor");
  const auto adaptor = newAdaptor();
  ASSERT_NE(adaptor, nullptr);
  const std::string line = "TelvaneVDRAdaptorSendMessage of " + object() + " ended the thread that called it";
  _log.expectError(line);
  _log.expectError("TelvaneVDRAdaptorRelease of " + object() + " threw an exception: released too often");
  bool hasComeBack = false;
  std::thread([&] {
    adaptor->sendMessageWithMethod(2, 0, {});
    hasComeBack = true;
  }).join();
  EXPECT_FALSE(hasComeBack);
  EXPECT_EQ(_log.count(LogLevel::Error, line), 1u);
}

TEST_F(LoadedWirelessDiagnosticsTest, aClassThatThrowsWhenItIsMadeMakesNoInstance) {
  givenAdaptor("ThrowingAdaptor");
  const auto bundle = open();
  ASSERT_NE(bundle, nullptr);
  _log.expectError("TelvaneVDRAdaptorCreate of " + object() + " threw an exception: cannot be made");
  EXPECT_EQ(bundle->newInstanceOfClass("Impossible"), nullptr);
}

TEST_F(LoadedWirelessDiagnosticsTest, anAdaptorThatThrowsInPlaceOfItsVersionIsNotUsed) {
  givenAdaptor("ThrowingAtOnceAdaptor");
  _log.expectError("TelvaneVDRAdaptorGetVersion of " + object() + " threw an exception: no version today");
  EXPECT_EQ(open(), nullptr);
}

}  // namespace
}  // namespace telvane::testing
