#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <filesystem>

#include "tests/endtoend/Instance.h"

namespace telvane::testing {
namespace {

using ::testing::HasSubstr;

class DaemonProcessTest : public ::testing::Test {
 protected:
  void givenServingInstance() {
    instance.startCollector();
    instance.givenStorebag("conferencing", openBag(instance.collectorURL("/events")));
    instance.startDaemon();
  }
  bool arrives(size_t count) {
    return eventually([this, count] { return instance.arrivedWithCategory(21).size() >= count; });
  }
  bool says(const std::string& text) {
    return eventually([this, &text] { return instance.read("sender.out").find(text) != std::string::npos; });
  }
  Instance instance;
};

TEST_F(DaemonProcessTest, endsAtOnceWithStatusZeroWhenItHoldsNothing) {
  instance.startDaemon();
  instance.daemon().signal(SIGTERM);
  EXPECT_EQ(instance.daemon().wait(), 0);
  EXPECT_TRUE(eventually([this] { return instance.daemonLogHas("startLogging: Daemon starts logging..."); }))
      << instance.daemonLog();
  EXPECT_TRUE(eventually([this] { return instance.daemonLogHas("main: Listener resumes with sandbox, start loop."); }))
      << instance.daemonLog();
}

TEST_F(DaemonProcessTest, sendsWhatSessionsHoldBeforeItEnds) {
  givenServingInstance();
  const auto sender = instance.startSender({"--count", "7", "--no-flush", "--again"});
  ASSERT_TRUE(says("configured: [splunk]")) << instance.daemonLog();
  ASSERT_TRUE(eventually([this] { return instance.daemonLogHas("Sending message for session 77"); }));
  instance.daemon().signal(SIGTERM);
  instance.daemon().signal(SIGTERM);
  EXPECT_EQ(instance.daemon().wait(), 0);
  EXPECT_TRUE(eventually([this] { return instance.arrivedWithCategory(0).size() >= 2; }))
      << "the stop message did not arrive\n"
      << instance.daemonLog();
}

TEST_F(DaemonProcessTest, replacesAStaleSocket) {
  std::filesystem::create_directories(instance.path("root/run/telvane"));
  const int listener = socket(AF_UNIX, SOCK_STREAM, 0);
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  instance.socketPath().copy(address.sun_path, sizeof(address.sun_path) - 1);
  ASSERT_EQ(bind(listener, reinterpret_cast<const sockaddr*>(&address), sizeof(address)), 0);
  close(listener);
  givenServingInstance();
  EXPECT_THAT(instance.sendEvents({}), HasSubstr("configured: [splunk]"));
}

TEST_F(DaemonProcessTest, aSecondDaemonOnALiveSocketSaysSoAndExitsWithOne) {
  instance.startDaemon();
  const auto second = instance.startSecondDaemon();
  EXPECT_EQ(second->wait(), 1);
  EXPECT_THAT(instance.read("second.err"), HasSubstr("telvaned: "));
  EXPECT_TRUE(instance.daemon().isRunning());
}

TEST_F(DaemonProcessTest, refusesAClientWithoutTheEntitlement) {
  std::filesystem::remove(instance.path("root/etc/telvane/entitlements.d/telvane-event-sender.plist"));
  givenServingInstance();
  // Its configuration is never answered; it is not waited for.
  const auto sender = instance.startSender({"--no-flush"});
  EXPECT_TRUE(eventually(
      [this] { return instance.daemonLogHas("does not have required telvane entitlement. Closing connection..."); }));
  EXPECT_TRUE(instance.arrived().empty());
}

TEST_F(DaemonProcessTest, aClientGoesOnWithTheNextDaemonWhenTheFirstIsKilled) {
  givenServingInstance();
  const auto sender = instance.startSender({"--again"});
  ASSERT_TRUE(says("flushed: ok")) << instance.daemonLog();
  instance.daemon().signal(SIGKILL);
  instance.daemon().wait();
  instance.startDaemon();
  sender->closeInput();
  sender->wait();
  // The next daemon's session was told nothing, so it refuses to report; the client is told so and stays whole.
  EXPECT_THAT(instance.read("sender.out"), HasSubstr("configured: nothing"));
  EXPECT_THAT(instance.sendEvents({}), HasSubstr("configured: [splunk]"));
}

TEST_F(DaemonProcessTest, clientsThatAreKilledLeaveNothingBehind) {
  givenServingInstance();
  for (int i = 0; i < 7; ++i) {
    const auto sender = instance.startSender({"--again"});
    ASSERT_TRUE(says("flushed: ok")) << "sender " << i << "\n" << instance.daemonLog();
    sender->signal(SIGKILL);
    sender->wait();
  }
  EXPECT_TRUE(eventually([this] { return instance.daemonLogHas("dealloc: TelvanedSession dealloc: 77"); }));
}

TEST_F(DaemonProcessTest, namesItsOptionsAndRefusesWrongOnes) {
  instance.startDaemon({"--nonsense"});
  EXPECT_EQ(instance.daemon().wait(), 2);
  EXPECT_THAT(instance.daemonLog(), HasSubstr("see telvaned --help"));
  instance.startDaemon({"--version"});
  EXPECT_EQ(instance.daemon().wait(), 0);
  EXPECT_THAT(instance.read("daemon.out"), HasSubstr("telvaned "));
}

}  // namespace
}  // namespace telvane::testing
