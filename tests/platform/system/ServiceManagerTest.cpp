#include "platform/system/ServiceManager.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstring>
#include <string>

#include "tests/support/ScratchFolder.h"

namespace telvane {
namespace {

class ServiceManagerTest : public ::testing::Test {
 protected:
  ~ServiceManagerTest() override {
    for (const char* name : {"LISTEN_PID", "LISTEN_FDS", "NOTIFY_SOCKET"}) ::unsetenv(name);
  }
  void givenPassedSockets(pid_t pid, const char* count) {
    ::setenv("LISTEN_PID", std::to_string(pid).c_str(), 1);
    ::setenv("LISTEN_FDS", count, 1);
  }
};

// The first passed socket is descriptor 3 by agreement.
TEST_F(ServiceManagerTest, wasActivatedOnlyWithSocketsForThisProcess) {
  const bool isOpen = ::fcntl(3, F_GETFD) >= 0 || ::dup2(0, 3) == 3;
  ASSERT_TRUE(isOpen);
  EXPECT_FALSE(servicemanager::wasActivated());
  givenPassedSockets(::getpid(), "1");
  EXPECT_TRUE(servicemanager::wasActivated());
  givenPassedSockets(::getpid() + 1, "1");
  EXPECT_FALSE(servicemanager::wasActivated());
  givenPassedSockets(::getpid(), "0");
  EXPECT_FALSE(servicemanager::wasActivated());
}

TEST_F(ServiceManagerTest, tellsTheManagerThatItServesAndThatItEnds) {
  testing::ScratchFolder folder;
  const int manager = ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  const std::string path = folder.at("notify");
  ASSERT_LT(path.size(), sizeof address.sun_path);
  std::memcpy(address.sun_path, path.c_str(), path.size());
  ASSERT_EQ(::bind(manager, reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
  ::setenv("NOTIFY_SOCKET", path.c_str(), 1);
  char buffer[64];
  servicemanager::notifyReady();
  ssize_t size = ::recv(manager, buffer, sizeof buffer, MSG_DONTWAIT);
  EXPECT_EQ(std::string(buffer, size < 0 ? 0 : static_cast<size_t>(size)), "READY=1");
  servicemanager::notifyStopping();
  size = ::recv(manager, buffer, sizeof buffer, MSG_DONTWAIT);
  EXPECT_EQ(std::string(buffer, size < 0 ? 0 : static_cast<size_t>(size)), "STOPPING=1");
  ::close(manager);
}

TEST_F(ServiceManagerTest, saysNothingWithoutAManager) {
  servicemanager::notifyReady();
  servicemanager::notifyStopping();
  EXPECT_FALSE(servicemanager::wasActivated());
}

}  // namespace
}  // namespace telvane
