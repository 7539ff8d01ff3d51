#include "tools/ControlTool.h"

#include <gmock/gmock.h>

#include <fstream>
#include <sstream>

#include "interfaces/AgentKeys.h"
#include "tests/client/ClientFixture.h"

namespace telvane::testing {
namespace {

using ::testing::HasSubstr;
using ::testing::StartsWith;

// The command line of telvanectl; what the commands do has tests of its own.
class ControlToolTest : public ClientFixture {
 protected:
  ControlToolTest() { log().allowErrors(); }
  int runTool(std::vector<const char*> arguments) {
    _output.str("");
    _errors.str("");
    arguments.insert(arguments.begin(), "telvanectl");
    return ControlTool(_context, _output, _errors).run(static_cast<int>(arguments.size()), arguments.data());
  }
  Value stored(std::string_view key) { return _client.platform().userDefaults.objectForKey("suite", key); }

  std::ostringstream _output;
  std::ostringstream _errors;
};

TEST_F(ControlToolTest, outputThatCannotBeWrittenIsAFailure) {
  std::ofstream full("/dev/full");
  const char* const arguments[] = {"telvanectl", "consent", "show"};
  EXPECT_EQ(ControlTool(_context, full, _errors).run(3, arguments), 1);
  EXPECT_EQ(_errors.str(), "telvanectl: cannot write to standard output; see whether its disk is full\n");
}

TEST_F(ControlToolTest, wrongUsageIsTwoAndPointsToTheHelp) {
  const std::vector<std::vector<const char*>> wrong = {
      {},
      {"nonsense"},
      {"send"},
      {"send", "--client-type", "7", "--category", "1"},
      {"send", "--client-type", "x", "--category", "1", "--type", "1"},
      {"send", "--client-type", "7", "--category", "70000", "--type", "1"},
      {"send", "--client-type", "7", "--category", "1", "--type", "1", "--count", "0"},
      {"one-shot", "--client-type", "7", "--category", "1", "--type", "1", "--flush"},
      {"upload", "--client-type", "7"},
      {"defaults"},
      {"defaults", "read"},
      {"defaults", "write", "suite", "key"},
      {"consent"},
      {"consent", "maybe"},
      {"status", "extra"}};
  for (const auto& arguments : wrong) {
    EXPECT_EQ(runTool(arguments), 2) << ::testing::PrintToString(arguments);
    EXPECT_THAT(_errors.str(), StartsWith("telvanectl: "));
    EXPECT_THAT(_errors.str(), HasSubstr("--help"));
    EXPECT_EQ(_errors.str().find('\n'), _errors.str().size() - 1) << _errors.str();
  }
}

TEST_F(ControlToolTest, hasHelpAndVersion) {
  EXPECT_EQ(runTool({"--help"}), 0);
  EXPECT_THAT(_output.str(), HasSubstr("one-shot"));
  EXPECT_EQ(runTool({"send", "--help"}), 0);
  EXPECT_THAT(_output.str(), HasSubstr("--digest-key"));
  EXPECT_EQ(runTool({"--version"}), 0);
  EXPECT_THAT(_output.str(), StartsWith("telvanectl "));
}

TEST_F(ControlToolTest, handsEveryOptionOn) {
  daemon().answer(Operation::DaemonStatus, Array{Dictionary{{kStatusVersion, "1.0"}}});
  daemon().answer(Operation::StartConfig, Array{Array{"splunk"}, Value(), Value()});
  daemon().answer(Operation::FetchDisplayURL, Array{"URL not available"});
  daemon().answer(Operation::SendMessageWithDictionary, Array{"taken"});
  daemon().answer(Operation::FlushMessages, Array{"flushed text", Value()});
  EXPECT_EQ(runTool({"send",
                     "--client-type",
                     "22",
                     "--category",
                     "1",
                     "--type",
                     "2",
                     "--client-name",
                     "me",
                     "--service-name",
                     "steps",
                     "--payload",
                     R"({"n": 1})",
                     "--count",
                     "2",
                     "--flag",
                     "3",
                     "--session-info",
                     R"({"SessionID": 77})",
                     "--user-info",
                     R"({"extra": true})",
                     "--digest-key",
                     "ff",
                     "--flush"}),
            0)
      << _errors.str();
  const Array info = daemon().last(Operation::SetSessionInfo).arguments;
  EXPECT_THAT(info[0], HasEntry(kTelvaneSessionInfoClientType.view(), 22));
  EXPECT_THAT(info[0], HasEntry(kTelvaneSessionInfoSessionID.view(), 77));
  EXPECT_EQ(info[1],
            Value(Dictionary{{Key("_clientName"), "me"}, {Key("_serviceName"), "steps"}, {Key("extra"), true}}));
  ASSERT_EQ(daemon().count(Operation::SendMessageWithDictionary), 2u);
  const Value message = daemon().last(Operation::SendMessageWithDictionary).arguments[0];
  EXPECT_THAT(message, HasEntry(kTelvaneMessageParametersCategory.view(), 1));
  EXPECT_THAT(message, HasEntry(kTelvaneMessageParametersType.view(), 2));
  EXPECT_THAT(message, HasEntry(kTelvaneMessageParametersFlag.view(), 3));
  EXPECT_EQ(daemon().count(Operation::SetDigestKey), 1u);
  EXPECT_EQ(daemon().count(Operation::FlushMessages), 1u);
}

TEST_F(ControlToolTest, withoutADaemonItSaysSoAndFails) {
  daemon().end();
  EXPECT_EQ(runTool({"status"}), 1);
  EXPECT_THAT(_errors.str(), HasSubstr("start telvaned"));
  EXPECT_EQ(runTool({"send", "--client-type", "7", "--category", "1", "--type", "1"}), 1);
  EXPECT_EQ(runTool({"one-shot", "--client-type", "7", "--category", "1", "--type", "1", "--client-name", "me"}), 1);
}

TEST_F(ControlToolTest, changesSettingsWithoutADaemon) {
  daemon().end();
  EXPECT_EQ(runTool({"defaults", "write", "suite", "key", "5"}), 0) << _errors.str();
  EXPECT_EQ(stored("key"), Value(5));
  EXPECT_EQ(runTool({"defaults", "write", "suite", "key", "5", "--string"}), 0);
  EXPECT_EQ(stored("key"), Value("5"));
  EXPECT_EQ(runTool({"defaults", "read", "suite", "key"}), 0);
  EXPECT_EQ(_output.str(), "5\n");
  EXPECT_EQ(runTool({"defaults", "delete", "suite", "key"}), 0);
  EXPECT_EQ(runTool({"defaults", "read", "suite", "key"}), 1);
  EXPECT_EQ(runTool({"consent", "on"}), 0);
  EXPECT_EQ(runTool({"consent", "show"}), 0);
  EXPECT_EQ(_output.str(), "on\n");
}

}  // namespace
}  // namespace telvane::testing
