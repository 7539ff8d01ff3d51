#include "tools/SettingsCommands.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <sstream>

#include "platform/system/DefaultsConsent.h"
#include "tests/support/MemoryUserDefaults.h"
#include "tests/support/RecordingLog.h"

namespace telvane::testing {
namespace {

using Form = SettingsCommands::ValueForm;

class SettingsCommandsTest : public ::testing::Test {
 protected:
  std::string printed() {
    std::string text = _output.str();
    _output.str("");
    return text;
  }
  void write(const std::string& key, const std::string& value, Form form = Form::JSONOrText) {
    const Result<void> written = _settings.write("suite", key, value, form);
    EXPECT_FALSE(written.has_error()) << key;
  }
  Value stored(std::string_view key) const { return _userDefaults.objectForKey("suite", key); }

  MemoryUserDefaults _userDefaults;
  std::ostringstream _output;
  std::ostringstream _errors;
  Printer _printer{"telvanectl", _output, _errors};
  SettingsCommands _settings{_userDefaults, _printer};
};

TEST_F(SettingsCommandsTest, storesJSONAsWhatItIsAndAnyOtherTextAsText) {
  write("boolean", "true");
  write("number", "5");
  write("list", "[1, \"a\"]");
  write("url", "https://localhost:1/bags");
  write("quoted", "\"5\"");
  EXPECT_EQ(stored("boolean"), Value(true));
  EXPECT_EQ(stored("number"), Value(5));
  EXPECT_EQ(stored("list"), Value(Array{1, "a"}));
  EXPECT_EQ(stored("url"), Value("https://localhost:1/bags"));
  EXPECT_EQ(stored("quoted"), Value("5"));
}

TEST_F(SettingsCommandsTest, storesTextOnRequest) {
  write("number", "5", Form::Text);
  EXPECT_EQ(stored("number"), Value("5"));
}

TEST_F(SettingsCommandsTest, doesNotStoreNull) {
  EXPECT_TRUE(_settings.write("suite", "key", "null", Form::JSONOrText).has_error());
  EXPECT_FALSE(stored("key").isPresent());
}

TEST_F(SettingsCommandsTest, readsAKeyOrTheWholeSuite) {
  write("text", "bare text");
  write("number", "5");
  EXPECT_FALSE(_settings.read("suite", "text").has_error());
  EXPECT_EQ(printed(), "bare text\n");
  EXPECT_FALSE(_settings.read("suite", "").has_error());
  EXPECT_EQ(printed(), "{\n  \"text\": \"bare text\",\n  \"number\": 5\n}\n");
}

TEST_F(SettingsCommandsTest, readsWhatJSONCannotHold) {
  ASSERT_FALSE(_userDefaults.setObject("suite", "data", Data::copyOf(std::string_view("\x01\x02"))).has_error());
  EXPECT_FALSE(_settings.read("suite", "data").has_error());
  EXPECT_EQ(printed(), "<0102>\n");
}

TEST_F(SettingsCommandsTest, failsToReadAKeyThatIsNotThere) {
  const Result<void> read = _settings.read("suite", "key");
  ASSERT_TRUE(read.has_error());
  EXPECT_EQ(read.error().description(), "there is no key in suite");
  EXPECT_EQ(printed(), "");
}

TEST_F(SettingsCommandsTest, removesAKeyOrAllOfTheSuite) {
  write("a", "1");
  write("b", "2");
  write("c", "3");
  EXPECT_FALSE(_settings.remove("suite", "a").has_error());
  EXPECT_FALSE(stored("a").isPresent());
  EXPECT_TRUE(stored("b").isPresent());
  EXPECT_FALSE(_settings.remove("suite", "").has_error());
  EXPECT_TRUE(_userDefaults.dictionaryRepresentation("suite").empty());
}

TEST_F(SettingsCommandsTest, consentIsWhatTheDaemonReads) {
  RecordingLog log;
  const DefaultsConsent consent(_userDefaults, log);
  EXPECT_FALSE(_settings.showConsent().has_error());
  EXPECT_EQ(printed(), "off\n");
  EXPECT_FALSE(_settings.setConsent(true).has_error());
  EXPECT_TRUE(consent.isSubmissionAllowed());
  EXPECT_FALSE(_settings.showConsent().has_error());
  EXPECT_EQ(printed(), "on\n");
  EXPECT_FALSE(_settings.setConsent(false).has_error());
  EXPECT_FALSE(consent.isSubmissionAllowed());
}

}  // namespace
}  // namespace telvane::testing
