#include <gtest/gtest.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <chrono>
#include <cstdlib>
#include <memory>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include "interfaces/SessionKeys.h"
#include "tests/client/RealDaemon.h"
#include "tests/support/ScratchFolder.h"

extern char** environ;

namespace telvane::testing {
namespace {

// What became of a process.
struct Outcome {
  int status = -1;  // 128 and the signal's number when a signal ended it
  std::string output;
};

Outcome waitFor(pid_t child, int output) {
  Outcome outcome;
  std::array<char, 4096> buffer;
  for (ssize_t size = 0; (size = ::read(output, buffer.data(), buffer.size())) > 0;) {
    outcome.output.append(buffer.data(), static_cast<size_t>(size));
  }
  ::close(output);
  int status = 0;
  if (::waitpid(child, &status, 0) != child) return outcome;
  outcome.status = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
  return outcome;
}

Outcome runProgram(std::vector<std::string> arguments, std::vector<std::string> settings) {
  std::array<int, 2> pipe{};
  if (::pipe(pipe.data()) != 0) return {};
  std::vector<char*> argv;
  for (std::string& argument : arguments) argv.push_back(argument.data());
  argv.push_back(nullptr);
  std::vector<char*> environment;
  for (char** variable = environ; *variable != nullptr; ++variable) environment.push_back(*variable);
  for (std::string& setting : settings) environment.insert(environment.begin(), setting.data());
  environment.push_back(nullptr);
  posix_spawn_file_actions_t actions;
  ::posix_spawn_file_actions_init(&actions);
  ::posix_spawn_file_actions_adddup2(&actions, pipe[1], STDOUT_FILENO);
  ::posix_spawn_file_actions_adddup2(&actions, pipe[1], STDERR_FILENO);
  ::posix_spawn_file_actions_addclose(&actions, pipe[0]);
  ::posix_spawn_file_actions_addclose(&actions, pipe[1]);
  pid_t child = -1;
  const int failure = ::posix_spawnp(&child, argv[0], &actions, nullptr, argv.data(), environment.data());
  ::posix_spawn_file_actions_destroy(&actions);
  ::close(pipe[1]);
  if (failure != 0) {
    ::close(pipe[0]);
    return {failure, "cannot be started"};
  }
  return waitFor(child, pipe[0]);
}

// A process that links the shared library, and a scripted daemon behind a real socket.
class ClientProcessTest : public ::testing::Test {
 protected:
  using Operation = ClientSessionOperation;

  void givenDaemon() {
    _daemon = std::make_unique<RealDaemon>(_root.path());
    script().answer(Operation::StartConfig, Array{Array{"splunk"}, Value(), Value()});
    script().answer(Operation::FetchDisplayURL, Array{"URL not available"});
    script().answer(Operation::SendMessageWithDictionary, Array{"taken"});
    script().answer(Operation::FlushMessages, Array{Value(), Value()});
    script().answer(Operation::SendMessageWithSessionInfo, Array{"finished"});
  }
  ScriptedDaemon& script() { return _daemon->script(); }
  Outcome runHelper(const std::string& mode) {
    return runProgram({TELVANE_PROGRAM_DIR "/telvane-client-helper", mode},
                      {"TELVANE_ROOT=" + _root.path(), "HOME=" + _root.path()});
  }
  void expectQuietSuccess(const std::string& mode) {
    const Outcome outcome = runHelper(mode);
    EXPECT_EQ(outcome.status, 0) << mode << " printed: " << outcome.output;
    EXPECT_EQ(outcome.output, "") << "the library must not print";
  }
  // The numbers in the payloads of the messages that came, in order.
  std::vector<int64_t> numbers() {
    std::vector<int64_t> numbers;
    for (const ScriptedDaemon::Call& call : script().calls()) {
      if (call.operation != Operation::SendMessageWithDictionary) continue;
      const Value& payload = (*call.arguments[0].dictionary())[kTelvaneMessageParametersPayload];
      if (payload.isDictionary()) numbers.push_back((*payload.dictionary())["number"].integerValue());
    }
    return numbers;
  }
  std::vector<int64_t> categories() {
    std::vector<int64_t> categories;
    for (const ScriptedDaemon::Call& call : script().calls()) {
      if (call.operation != Operation::SendMessageWithDictionary) continue;
      categories.push_back((*call.arguments[0].dictionary())[kTelvaneMessageParametersCategory].integerValue());
    }
    return categories;
  }
  static std::vector<int64_t> upTo(int64_t last) {
    std::vector<int64_t> numbers;
    for (int64_t number = 1; number <= last; ++number) numbers.push_back(number);
    return numbers;
  }

  ScratchFolder _root;
  std::unique_ptr<RealDaemon> _daemon;
};

constexpr int kMany = 5000;

// The sanitizers do not support threads in the child of a process with threads: the one refuses them, and the other's
// allocator does not unlock itself there.
#if defined(__SANITIZE_THREAD__) || defined(__SANITIZE_ADDRESS__)
constexpr bool kMayForkWithThreads = false;
#else
constexpr bool kMayForkWithThreads = true;
#endif

TEST_F(ClientProcessTest, deliversWhatWasSentBeforeMainReturns) {
  givenDaemon();
  expectQuietSuccess("sendAndReturn");
  ASSERT_TRUE(script().waitForEndedConnections(1));
  EXPECT_EQ(numbers(), upTo(kMany));
}

TEST_F(ClientProcessTest, deliversWhatWasSentBeforeExit) {
  givenDaemon();
  expectQuietSuccess("sendAndExit");
  ASSERT_TRUE(script().waitForEndedConnections(1));
  EXPECT_EQ(numbers(), upTo(kMany));
}

TEST_F(ClientProcessTest, finishesAReleasedSessionBeforeTheProcessEnds) {
  givenDaemon();
  expectQuietSuccess("releaseAndReturn");
  ASSERT_TRUE(script().waitForEndedConnections(1));
  EXPECT_EQ(numbers(), upTo(kMany));
  EXPECT_EQ(script().count(Operation::FinishSessionGracefully), 1u);
}

TEST_F(ClientProcessTest, deliversAOneShotMessageBeforeTheProcessEnds) {
  givenDaemon();
  expectQuietSuccess("oneShotAndReturn");
  EXPECT_TRUE(script().waitFor(Operation::SendMessageWithSessionInfo, 1));
}

TEST_F(ClientProcessTest, givesAForkedChildSessionsOfItsOwn) {
  if (!kMayForkWithThreads) GTEST_SKIP();
  givenDaemon();
  expectQuietSuccess("forkWithSession");
  EXPECT_EQ(categories(), (std::vector<int64_t>{1, 2, 3}));
  EXPECT_EQ(script().connectionCount(), 2u);
}

TEST_F(ClientProcessTest, survivesForksWhileOtherThreadsSend) {
  if (!kMayForkWithThreads) GTEST_SKIP();
  givenDaemon();
  expectQuietSuccess("forkWhileSending");
}

TEST_F(ClientProcessTest, leavesTheSignalsOfItsHostAlone) {
  givenDaemon();
  expectQuietSuccess("keepSignals");
}

TEST_F(ClientProcessTest, isNotKilledByADaemonThatEndsConnections) {
  givenDaemon();
  script().answer(Operation::FlushMessages,
                  [this](const ScriptedDaemon::Call&, ipc::ReplyBlock) { script().connection().invalidate(); });
  expectQuietSuccess("surviveADaemonThatEndsConnections");
  EXPECT_GT(script().connectionCount(), 1u) << "the session must have connected again";
}

TEST_F(ClientProcessTest, survivesBlocksThatThrow) {
  givenDaemon();
  expectQuietSuccess("throwInBlocks");
}

TEST_F(ClientProcessTest, startsNoThreadBeforeThereIsSomethingToSend) { expectQuietSuccess("startNoThreadUnasked"); }

TEST_F(ClientProcessTest, leavesInGoodOrderWithoutADaemon) { expectQuietSuccess("leaveWithoutADaemon"); }

TEST_F(ClientProcessTest, letsItsHostExitInABlock) {
  givenDaemon();
  expectQuietSuccess("exitInACompletion");
}

TEST_F(ClientProcessTest, staysLoadedWhenItIsUnloaded) {
  givenDaemon();
  expectQuietSuccess("unloadTheLibrary");
}

TEST_F(ClientProcessTest, leavesWithARunningTimer) {
  givenDaemon();
  expectQuietSuccess("leaveWithARunningTimer");
  ASSERT_TRUE(script().waitForEndedConnections(1));
  EXPECT_GE(numbers().size(), 1u) << "the first report is out for long";
  EXPECT_EQ(numbers(), upTo(static_cast<int64_t>(numbers().size())));
}

TEST_F(ClientProcessTest, endsTheTimerOfASessionThatIsLetGo) {
  givenDaemon();
  expectQuietSuccess("releaseWithARunningTimer");
  ASSERT_TRUE(script().waitForEndedConnections(2));
  EXPECT_EQ(numbers(), upTo(1));
  EXPECT_EQ(script().count(Operation::FinishSessionGracefully), 2u);
}

TEST_F(ClientProcessTest, leavesWithAStuckBlock) {
  givenDaemon();
  const auto begin = std::chrono::steady_clock::now();
  expectQuietSuccess("leaveWithAStuckBlock");
  EXPECT_LT(std::chrono::steady_clock::now() - begin, std::chrono::seconds(20));
}

TEST_F(ClientProcessTest, survivesModulesThatThrow) {
  givenDaemon();
  expectQuietSuccess("throwInModules");
  EXPECT_GE(numbers().size(), 1u);
}

TEST_F(ClientProcessTest, givesAForkedChildPeriodicTasksOfItsOwn) {
  if (!kMayForkWithThreads) GTEST_SKIP();
  givenDaemon();
  expectQuietSuccess("forkWithATimer");
  EXPECT_EQ(script().connectionCount(), 2u);
}

TEST_F(ClientProcessTest, theExampleReportsTheMetricsOfItsProcess) {
  givenDaemon();
  const Outcome outcome = runProgram({TELVANE_PROGRAM_DIR "/report-metrics", "--seconds", "2"},
                                     {"TELVANE_ROOT=" + _root.path(), "HOME=" + _root.path()});
  EXPECT_EQ(outcome.status, 0) << outcome.output;
  // Two, unless the machine was too busy for the second one.
  ASSERT_FALSE(categories().empty()) << outcome.output;
  const std::string made = "made " + std::to_string(categories().size()) + " reports, flushed";
  EXPECT_NE(outcome.output.find(made), std::string::npos) << outcome.output;
  EXPECT_EQ(categories().front(), 20);
  const Dictionary event = *script().last(Operation::SendMessageWithDictionary).arguments[0].dictionary();
  EXPECT_EQ(event[kTelvaneMessageParametersFlag], Value(1));
  const Dictionary payload = *event[kTelvaneMessageParametersPayload].dictionary();
  const Dictionary process = *payload["process"].dictionary();
  EXPECT_GT(process["residentKilobytes"].integerValue(), 500);
  EXPECT_GE(process["peakKilobytes"].integerValue(), process["residentKilobytes"].integerValue());
  EXPECT_GE(process["descriptors"].integerValue(), 3);
  EXPECT_GE(process["threads"].integerValue(), 2);
  EXPECT_GE(process["user"].realValue() + process["system"].realValue(), 0.0);
  EXPECT_GE(process["voluntarySwitches"].integerValue(), 1);
  EXPECT_TRUE(process.contains("involuntarySwitches"));
  EXPECT_EQ(payload["samples"], Value(Array{process["residentKilobytes"]}));
}

TEST_F(ClientProcessTest, theExampleUpdatesBetweenItsReports) {
  givenDaemon();
  const Outcome outcome = runProgram({TELVANE_PROGRAM_DIR "/report-metrics", "--seconds", "4", "--report-every", "2"},
                                     {"TELVANE_ROOT=" + _root.path(), "HOME=" + _root.path()});
  EXPECT_EQ(outcome.status, 0) << outcome.output;
  // How many there are is up to the machine; every one tells of two ticks.
  ASSERT_FALSE(categories().empty()) << outcome.output;
  for (const ScriptedDaemon::Call& call : script().calls()) {
    if (call.operation != Operation::SendMessageWithDictionary) continue;
    const Dictionary event = *call.arguments[0].dictionary();
    EXPECT_EQ(event[kTelvaneMessageParametersCategory], Value(20));
    EXPECT_EQ((*event[kTelvaneMessageParametersPayload].dictionary())["samples"].array()->size(), 2u);
  }
}

TEST_F(ClientProcessTest, theExampleSaysWhatItTakes) {
  for (const std::vector<std::string>& wrong :
       {std::vector<std::string>{"--seconds"}, {"--seconds", "0"}, {"--seconds", "1x"}, {"--what", "1"}}) {
    std::vector<std::string> arguments{TELVANE_PROGRAM_DIR "/report-metrics"};
    arguments.insert(arguments.end(), wrong.begin(), wrong.end());
    const Outcome outcome = runProgram(std::move(arguments), {});
    EXPECT_EQ(outcome.status, 2);
    EXPECT_NE(outcome.output.find("usage: "), std::string::npos) << outcome.output;
  }
}

}  // namespace
}  // namespace telvane::testing
