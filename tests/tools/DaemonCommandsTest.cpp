#include "tools/DaemonCommands.h"

#include <gmock/gmock.h>

#include <filesystem>
#include <sstream>

#include "interfaces/AgentKeys.h"
#include "interfaces/ErrorCoding.h"
#include "interfaces/TelvaneErrors.h"
#include "tests/client/ClientFixture.h"
#include "tests/support/ScratchFolder.h"

namespace telvane::testing {
namespace {

using ::testing::HasSubstr;

// The commands in a client process, and a scripted daemon.
class DaemonCommandsTest : public ClientFixture {
 protected:
  DaemonCommandsTest() {
    log().allowErrors();
    _options.clientType = 7;
    _options.category = 12;
    _options.type = 1;
    _options.clientName = "me";
    daemon().answer(Operation::DaemonStatus, Array{Dictionary{{kStatusVersion, "1.0"}, {kStatusProcessID, 42}}});
    daemon().answer(Operation::StartConfig, Array{Array{"splunk", "gonzo"}, Value(), Array{99}});
    daemon().answer(Operation::FetchDisplayURL, Array{"URL not available"});
    daemon().answer(Operation::SendMessageWithDictionary, Array{"the event as it went"});
    daemon().answer(Operation::FlushMessages, Array{"the batch as it went", Value()});
    daemon().answer(Operation::SendMessageWithSessionInfo, Array{"finished"});
  }
  std::string printed() const { return _output.str(); }
  std::string faultOf(const Result<void>& result) { return result.has_error() ? result.error().description() : "none"; }

  std::ostringstream _output;
  std::ostringstream _errors;
  Printer _printer{"telvanectl", _output, _errors};
  DaemonCommands _commands{_context, _printer};
  MessageOptions _options;
};

TEST_F(DaemonCommandsTest, sendsAsOftenAsAskedAndPrintsBackendsAndReplies) {
  _options.count = 3;
  EXPECT_EQ(faultOf(_commands.send(_options)), "none");
  run();
  EXPECT_THAT(printed(), HasSubstr("enabled backends: splunk, gonzo\n"));
  EXPECT_THAT(printed(), HasSubstr("sent: 3\n"));
  EXPECT_THAT(printed(), HasSubstr("the event as it went\nthe event as it went\nthe event as it went\n"));
  EXPECT_EQ(daemon().count(Operation::SendMessageWithDictionary), 3u);
  EXPECT_EQ(daemon().count(Operation::FlushMessages), 0u);
  EXPECT_EQ(daemon().count(Operation::FinishSessionGracefully), 1u);
}

TEST_F(DaemonCommandsTest, flushesWhenAskedTo) {
  _options.isFlushing = true;
  EXPECT_EQ(faultOf(_commands.send(_options)), "none");
  EXPECT_THAT(printed(), HasSubstr("the batch as it went\n"));
  EXPECT_THAT(printed(), HasSubstr("flushed\n"));
}

TEST_F(DaemonCommandsTest, tellsWhyAFlushFailed) {
  _options.isFlushing = true;
  daemon().answer(Operation::FlushMessages,
                  Array{Value(), errorcoding::encode(makeTelvaneError("Nothing to flush", -1))});
  EXPECT_EQ(faultOf(_commands.send(_options)), "flush: Nothing to flush");
}

TEST_F(DaemonCommandsTest, saysWhatTheStorebagFiltersOut) {
  _options.category = 99;
  EXPECT_EQ(faultOf(_commands.send(_options)), "none");
  EXPECT_THAT(printed(), HasSubstr("filtered out by the storebag: 1\n"));
  EXPECT_EQ(daemon().count(Operation::SendMessageWithDictionary), 0u);
}

TEST_F(DaemonCommandsTest, givesTheDigestKeyToTheDaemon) {
  _options.digestKey = "0102";
  EXPECT_EQ(faultOf(_commands.send(_options)), "none");
  ASSERT_EQ(daemon().count(Operation::SetDigestKey), 1u);
  EXPECT_EQ(daemon().last(Operation::SetDigestKey).arguments[0], Value(Data::copyOf(std::string_view("\x01\x02"))));
}

TEST_F(DaemonCommandsTest, refusesAClientTypeThatThereIsNotAndACategoryOfZero) {
  _options.clientType = 4;
  EXPECT_NE(faultOf(_commands.send(_options)), "none");
  EXPECT_NE(faultOf(_commands.oneShot(_options)), "none");
  EXPECT_EQ(daemon().count(Operation::StartConfig), 0u);
  _options.clientType = 7;
  _options.category = 0;
  EXPECT_THAT(faultOf(_commands.send(_options)), HasSubstr("refused"));
  EXPECT_THAT(faultOf(_commands.oneShot(_options)), HasSubstr("refused"));
  EXPECT_EQ(daemon().count(Operation::SendMessageWithSessionInfo), 0u);
}

TEST_F(DaemonCommandsTest, sendsOneShotsAndWaitsUntilTheyAreTaken) {
  _options.count = 2;
  _options.payload = R"({"frames": 30})";
  EXPECT_EQ(faultOf(_commands.oneShot(_options)), "none");
  EXPECT_THAT(printed(), HasSubstr("sent: 2\n"));
  ASSERT_EQ(daemon().count(Operation::SendMessageWithSessionInfo), 2u);
  const Array arguments = daemon().last(Operation::SendMessageWithSessionInfo).arguments;
  EXPECT_EQ(arguments[2], Value(12));
  EXPECT_THAT(arguments[4], HasEntry("frames", 30));
}

TEST_F(DaemonCommandsTest, refusesAOneShotThatTheDaemonWouldDropInSilence) {
  _options.clientName = "";
  EXPECT_THAT(faultOf(_commands.oneShot(_options)), HasSubstr("--client-name"));
  EXPECT_EQ(daemon().count(Operation::SendMessageWithSessionInfo), 0u);
}

TEST_F(DaemonCommandsTest, uploadsNothingWithoutAnUploadServer) {
  _options.uploadFile = "/etc/hostname";
  EXPECT_THAT(faultOf(_commands.upload(_options)), HasSubstr("no upload server"));
  EXPECT_EQ(daemon().count(Operation::UploadFileAtPath), 0u);
}

TEST_F(DaemonCommandsTest, uploadsAFileAndSaysWhetherItIsStillThere) {
  ScratchFolder folder;
  daemon().answer(Operation::StartConfig, Array{Array{"splunk", "upload_server"}, Value(), Array{99}});
  daemon().answer(Operation::UploadFileAtPath, Array{true});
  _options.uploadFile = folder.write("log", "text");
  EXPECT_EQ(faultOf(_commands.upload(_options)), "none");
  EXPECT_THAT(printed(), HasSubstr("posted: " + _options.uploadFile + "; it is still there"));
  _output.str("");
  daemon().answer(Operation::UploadFileAtPath, [&](const ScriptedDaemon::Call&, ipc::ReplyBlock reply) {
    std::filesystem::remove(_options.uploadFile);
    reply(Array{true});
  });
  EXPECT_EQ(faultOf(_commands.upload(_options)), "none");
  EXPECT_THAT(printed(), HasSubstr("uploaded: " + _options.uploadFile + "\n"));
}

TEST_F(DaemonCommandsTest, saysThatTheDaemonRefusesAFile) {
  ScratchFolder folder;
  daemon().answer(Operation::StartConfig, Array{Array{"upload_server"}, Value(), Array{99}});
  daemon().answer(Operation::UploadFileAtPath, Array{false});
  _options.uploadFile = folder.write("log", "text");
  EXPECT_THAT(faultOf(_commands.upload(_options)), HasSubstr("the daemon refused " + _options.uploadFile));
  _options.uploadFile = folder.at("nothing");
  EXPECT_EQ(faultOf(_commands.upload(_options)), "cannot read " + _options.uploadFile);
}

TEST_F(DaemonCommandsTest, showsTheStatusForPeopleAndAsJSON) {
  EXPECT_EQ(faultOf(_commands.status(DaemonCommands::StatusForm::Readable)), "none");
  EXPECT_THAT(printed(), HasSubstr("telvaned 1.0, pid 42"));
  _output.str("");
  EXPECT_EQ(faultOf(_commands.status(DaemonCommands::StatusForm::JSON)), "none");
  EXPECT_EQ(printed(), "{\n  \"version\": \"1.0\",\n  \"pid\": 42\n}\n");
}

TEST_F(DaemonCommandsTest, everyCommandSaysThatThereIsNoDaemon) {
  daemon().end();
  const std::string advice = "start telvaned";
  EXPECT_THAT(faultOf(_commands.status(DaemonCommands::StatusForm::JSON)), HasSubstr(advice));
  EXPECT_THAT(faultOf(_commands.send(_options)), HasSubstr(advice));
  EXPECT_THAT(faultOf(_commands.oneShot(_options)), HasSubstr(advice));
  EXPECT_THAT(faultOf(_commands.upload(_options)), HasSubstr(advice));
  EXPECT_EQ(printed(), "");
}

TEST_F(DaemonCommandsTest, saysThatTheDaemonDoesNotLetItIn) {
  daemon().refuse();
  EXPECT_THAT(faultOf(_commands.send(_options)), HasSubstr("grant"));
}

TEST_F(DaemonCommandsTest, doesNotWaitForADaemonThatEndsTheSession) {
  daemon().answer(Operation::StartConfig,
                  [this](const ScriptedDaemon::Call&, ipc::ReplyBlock) { daemon().connection().invalidate(); });
  EXPECT_THAT(faultOf(_commands.send(_options)), HasSubstr("ended the session"));
}

TEST_F(DaemonCommandsTest, givesUpOnADaemonThatDoesNotAnswer) {
  daemon().answer(Operation::DaemonStatus, [](const ScriptedDaemon::Call&, ipc::ReplyBlock reply) {
    static_cast<void>(new ipc::ReplyBlock(std::move(reply)));
  });
  EXPECT_THAT(faultOf(_commands.status(DaemonCommands::StatusForm::JSON)), HasSubstr("does not answer"));
}

}  // namespace
}  // namespace telvane::testing
