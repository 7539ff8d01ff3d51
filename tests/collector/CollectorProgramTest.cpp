#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <chrono>
#include <csignal>
#include <memory>
#include <thread>

#include "tests/support/ChildProcess.h"
#include "tests/support/ScratchFolder.h"
#include "tests/support/TestCertificates.h"

namespace telvane::testing {
namespace {

using ::testing::HasSubstr;
using ::testing::MatchesRegex;

// The program as a process of its own.
class CollectorProgramTest : public ::testing::Test {
 protected:
  std::unique_ptr<ChildProcess> start(const std::string& address, const std::string& certificate) {
    const std::string program = std::string(TELVANE_PROGRAM_DIR) + "/telvane-collector";
    const std::vector<std::string> arguments{program,
                                             "--listen",
                                             address,
                                             "--certificate",
                                             certificate,
                                             "--private-key",
                                             _server.privateKeyFile,
                                             "--storebags",
                                             _scratch.at("bags"),
                                             "--events",
                                             _scratch.at("events")};
    return std::make_unique<ChildProcess>(arguments, std::vector<std::string>{"PATH=/usr/bin:/bin"},
                                          ChildProcess::Files{_scratch.at("out"), _scratch.at("err")});
  }
  // The first line that the program printed; empty when it ended or took too long.
  std::string address(ChildProcess& collector) {
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(20);
    while (std::chrono::steady_clock::now() < deadline && collector.isRunning()) {
      const std::string text = _scratch.read("out");
      if (const size_t end = text.find('\n'); end != std::string::npos) return text.substr(0, end);
      std::this_thread::yield();
    }
    return "";
  }

  ScratchFolder _scratch;
  TestCertificates _certificates{_scratch.path()};
  TestCertificates::Server _server = _certificates.valid();
};

TEST_F(CollectorProgramTest, printsTheAddressThatItPickedAndEndsWellOnSIGTERM) {
  const auto collector = start("127.0.0.1:0", _server.certificateFile);
  EXPECT_THAT(address(*collector), MatchesRegex("127\\.0\\.0\\.1:[1-9][0-9]*")) << _scratch.read("err");
  collector->signal(SIGTERM);
  EXPECT_EQ(collector->wait(), 0);
}

TEST_F(CollectorProgramTest, saysWhenTheAddressIsTaken) {
  const auto first = start("127.0.0.1:0", _server.certificateFile);
  const std::string taken = address(*first);
  ASSERT_NE(taken, "");
  const auto second = start(taken, _server.certificateFile);
  EXPECT_EQ(second->wait(), 1);
  EXPECT_THAT(_scratch.read("err"), HasSubstr("telvane-collector: "));
}

TEST_F(CollectorProgramTest, saysWhenTheCertificateCannotBeRead) {
  const auto collector = start("127.0.0.1:0", _scratch.at("nothing.pem"));
  EXPECT_EQ(collector->wait(), 1);
  EXPECT_THAT(_scratch.read("err"), HasSubstr("nothing.pem"));
}

}  // namespace
}  // namespace telvane::testing
