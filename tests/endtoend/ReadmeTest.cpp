// The README's instance of one's own: its lines are run as they stand, with the programs of this build.
#include <arpa/inet.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>

#include "tests/support/ChildProcess.h"
#include "tests/support/ScratchFolder.h"

namespace telvane::testing {
namespace {

using ::testing::HasSubstr;

// A port that nobody listens on, so that the lines' own need not be free here. Empty when there is none.
std::string unusedPort() {
  const int descriptor = ::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  socklen_t size = sizeof address;
  auto* place = reinterpret_cast<sockaddr*>(&address);
  const bool isBound = ::bind(descriptor, place, size) == 0 && ::getsockname(descriptor, place, &size) == 0;
  ::close(descriptor);
  return isBound ? std::to_string(ntohs(address.sin_port)) : std::string();
}

class ReadmeTest : public ::testing::Test {
 protected:
  // Runs them in a folder for scratch files of its own; returns the exit status.
  int run() {
    std::filesystem::create_directories(scratch.at("tmp"));
    std::vector<std::string> variables{"TMPDIR=" + scratch.at("tmp")};
    // The sanitizers' options, and what finds shared objects.
    for (const char* name : {"PATH", "LD_LIBRARY_PATH", "ASAN_OPTIONS", "UBSAN_OPTIONS", "TSAN_OPTIONS"}) {
      if (const char* value = std::getenv(name)) variables.push_back(std::string(name) + "=" + value);
    }
    ChildProcess lines({"/bin/sh", TELVANE_SOURCE_DIR "/scripts/try-readme", "--programs", TELVANE_PROGRAM_DIR,
                        "--port", unusedPort()},
                       variables, {.output = scratch.at("out"), .errors = scratch.at("err")});
    return lines.wait();
  }

  ScratchFolder scratch;
};

TEST_F(ReadmeTest, theLinesForAnInstanceOfOnesOwnBringAnEventToTheCollector) {
  ASSERT_EQ(run(), 0) << scratch.read("out") << scratch.read("err");
  EXPECT_THAT(scratch.read("out"), HasSubstr("0 errors, 3 warnings\n"));
  EXPECT_THAT(scratch.read("out"), HasSubstr("the signature is good, version 1\n"));
  EXPECT_THAT(scratch.read("out"), HasSubstr("\nenabled backends: splunk\n"));
  EXPECT_THAT(scratch.read("out"), HasSubstr(R"({"event":{"steps":4200,)"));
  EXPECT_TRUE(std::filesystem::is_empty(scratch.at("tmp")));
}

}  // namespace
}  // namespace telvane::testing
