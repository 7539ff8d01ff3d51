#include <grp.h>
#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>

#include "tests/platform/ipc/HostilePeer.h"
#include "tests/platform/ipc/LocalServiceFixture.h"

namespace telvane::testing {
namespace {

using Operation = TalkingObject::Operation;

class SocketListenerTest : public LocalServiceFixture {};

TEST_F(SocketListenerTest, everybodyMayConnectToItsSocket) {
  serve();
  struct stat status {};
  ASSERT_EQ(::stat(socketPath().c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 0777u, 0666u);
  EXPECT_EQ(daemon->checkLookUp(kServiceName), 0);
}

TEST_F(SocketListenerTest, anAbsentServiceMayBeLookedUp) {
  ipc::SocketService service(files, dispatch, log, entitlements);
  EXPECT_EQ(service.checkLookUp("com.corvex.absent"), 0);
}

TEST_F(SocketListenerTest, removesItsSocketWhenItStops) {
  serve();
  listener->stop();
  listener->stop();
  EXPECT_FALSE(std::filesystem::exists(socketPath()));
  const auto connection = connected();
  EXPECT_TRUE(clientEvents.waitFor(1)) << "a stopped listener was connected to";
}

TEST_F(SocketListenerTest, leavesALaterDaemonsSocketInPlace) {
  serve();
  std::filesystem::remove(socketPath());
  auto later = ipc::unixsocket::listenAt(socketPath());
  ASSERT_TRUE(later) << later.error().description();
  stopServing();
  EXPECT_TRUE(std::filesystem::exists(socketPath()));
}

TEST_F(SocketListenerTest, doesNotReplaceAFileThatIsNoSocket) {
  scratch.write(std::string("run/telvane/") + kServiceName + ".socket", "precious");
  ipc::SocketService service(files, dispatch, log, entitlements);
  const auto made = service.newListener(kServiceName);
  ASSERT_FALSE(made);
  EXPECT_EQ(made.error().code(), EADDRINUSE) << made.error().description();
  EXPECT_EQ(scratch.read(std::string("run/telvane/") + kServiceName + ".socket"), "precious");
}

TEST_F(SocketListenerTest, servesAtAPathLongerThanASocketAddress) {
  const std::string root = scratch.path() + "/" + std::string(120, 'd');
  const PosixFileSystem below(Paths{root, root});
  ipc::SocketService service(below, dispatch, log, entitlements);
  auto made = service.newListener(kServiceName);
  ASSERT_TRUE(made) << made.error().description();
  (*made)->setDelegate(&delegate);
  (*made)->resume();
  auto connection = service.newConnection(kServiceName);
  ASSERT_TRUE(connection) << connection.error().description();
  (*connection)->resume();
  EXPECT_TRUE(callAndWait(**connection, Operation::kEcho, {}).values);
}

TEST_F(SocketListenerTest, refusesAServiceNameThatIsAPath) {
  ipc::SocketService service(files, dispatch, log, entitlements);
  EXPECT_EQ(service.newConnection("../escape").error().code(), EINVAL);
  EXPECT_EQ(service.newListener("").error().code(), EINVAL);
}

TEST_F(SocketListenerTest, acceptedConnectionsLiveOnWhenTheListenerGoes) {
  serve();
  const auto connection = connected();
  ASSERT_TRUE(callAndWait(*connection, Operation::kEcho, {}).values);
  listener.reset();
  EXPECT_TRUE(callAndWait(*connection, Operation::kEcho, {}).values);
}

TEST_F(SocketListenerTest, asksForTheEntitlementOfTheRealPeer) {
  const std::string executable = std::filesystem::read_symlink("/proc/self/exe").native();
  delegate.entitlement = "com.corvex.private.telvaned";
  serve();
  const auto refused = connected();
  ASSERT_TRUE(clientEvents.waitFor(1)) << "a peer without a grant was accepted";
  EXPECT_EQ(delegate.connections.size(), 0u);
  scratch.write("etc/telvane/entitlements.d/test.plist",
                "<plist version=\"1.0\"><dict><key>executables</key><array><string>" + executable +
                    "</string></array><key>entitlements</key><dict><key>com.corvex.private.telvaned</key><true/></dict>"
                    "</dict></plist>");
  const auto accepted = connected();
  const auto outcome = callAndWait(*accepted, Operation::kEcho, {});
  EXPECT_TRUE(outcome.values) << outcome.error.description();
}

TEST_F(SocketListenerTest, readsUserAndGroupsOfThePeerFromTheSocket) {
  auto listening = ipc::unixsocket::listenAt(scratch.at("s"));
  ASSERT_TRUE(listening) << listening.error().description();
  auto here = ipc::unixsocket::connectTo(scratch.at("s"));
  ASSERT_TRUE(here) << here.error().description();
  auto there = ipc::unixsocket::acceptFrom(listening->get());
  ASSERT_TRUE(there) << there.error().description();
  const auto peer = ipc::unixsocket::peerOf(there->get());
  std::vector<gid_t> groups(static_cast<size_t>(::getgroups(0, nullptr)));
  groups.resize(static_cast<size_t>(::getgroups(static_cast<int>(groups.size()), groups.data())));
  EXPECT_EQ(peer.processID, ::getpid());
  EXPECT_EQ(peer.userID, ::geteuid());
  EXPECT_EQ(peer.groupID, ::getegid());
  EXPECT_EQ(peer.supplementaryGroups, groups);
  EXPECT_EQ(peer.executable, std::filesystem::read_symlink("/proc/self/exe").native());
}

}  // namespace
}  // namespace telvane::testing
