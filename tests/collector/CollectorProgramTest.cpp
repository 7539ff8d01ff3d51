#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <openssl/bio.h>
#include <openssl/ssl.h>

#include <array>
#include <chrono>
#include <csignal>
#include <filesystem>
#include <memory>
#include <thread>

#include "tests/support/ChildProcess.h"
#include "tests/support/ScratchFolder.h"
#include "tests/support/TestCertificates.h"

namespace telvane::testing {
namespace {

namespace fs = std::filesystem;
using ::testing::HasSubstr;
using ::testing::MatchesRegex;

// The program as a process of its own.
class CollectorProgramTest : public ::testing::Test {
 protected:
  std::unique_ptr<ChildProcess> start(const std::string& address, const std::string& certificate,
                                      const std::vector<std::string>& more = {}) {
    const std::string program = std::string(TELVANE_PROGRAM_DIR) + "/telvane-collector";
    std::vector<std::string> arguments{program,
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
    arguments.insert(arguments.end(), more.begin(), more.end());
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

// A device that posts a file by hand, so that it can stop in the middle. What does not work fails the test.
class ManualUpload {
 public:
  ManualUpload(const std::string& address, const std::string& path, size_t length, const char* method = "POST")
      : _context(::SSL_CTX_new(::TLS_client_method()), &::SSL_CTX_free),
        _line(::BIO_new_ssl_connect(_context.get()), &::BIO_free_all) {
    ::BIO_set_conn_hostname(_line.get(), address.c_str());
    EXPECT_EQ(::BIO_do_connect(_line.get()), 1);
    send(std::string(method) + " " + path + " HTTP/1.1\r\nHost: " + address +
         "\r\nContent-Length: " + std::to_string(length) + "\r\n\r\n");
  }
  void send(std::string_view bytes) {
    while (!bytes.empty()) {
      const int written = ::BIO_write(_line.get(), bytes.data(), static_cast<int>(bytes.size()));
      ASSERT_GT(written, 0) << "the collector has ended the connection";
      bytes.remove_prefix(static_cast<size_t>(written));
    }
  }
  // What the collector answers, up to the end of this text.
  std::string answerUntil(std::string_view end) {
    std::string answer;
    std::array<char, 1024> buffer{};
    while (answer.find(end) == std::string::npos) {
      const int count = ::BIO_read(_line.get(), buffer.data(), buffer.size());
      if (count <= 0) break;
      answer.append(buffer.data(), static_cast<size_t>(count));
    }
    return answer;
  }

 private:
  const std::unique_ptr<SSL_CTX, decltype(&::SSL_CTX_free)> _context;
  const std::unique_ptr<BIO, decltype(&::BIO_free_all)> _line;
};

constexpr char kHeadsEnd[] = "\r\n\r\n";
// The rest of an answer that has no body, up to the end of its head.
constexpr char kNoBody[] = "(.|\n)*\r\nContent-Length: 0\r\n(.|\n)*\r\n";

TEST_F(CollectorProgramTest, withoutAFolderForThemItForbidsUploadsOfAnySize) {
  const auto collector = start("127.0.0.1:0", _server.certificateFile);
  const std::string served = address(*collector);
  ASSERT_NE(served, "");
  // The most that is gathered in memory, and more.
  constexpr size_t kMegabytes = 65;
  const std::string megabyte(1u << 20, 'x');
  const auto answerTo = [&](const char* path, const char* end) {
    ManualUpload upload(served, path, kMegabytes * megabyte.size());
    for (size_t i = 0; i < kMegabytes; ++i) upload.send(megabyte);
    return upload.answerUntil(end);
  };
  EXPECT_THAT(answerTo("/upload?filename=log&raw=true", "FOLDER\n"),
              MatchesRegex("HTTP/1.1 403 (.|\n)*uploads are not taken; start with --uploads FOLDER\n"));
  EXPECT_THAT(answerTo("/logdata", kHeadsEnd), MatchesRegex(std::string("HTTP/1.1 403 ") + kNoBody));
}

// Whatever path a bag gives for log data: any text would be their location.
TEST_F(CollectorProgramTest, saysNothingToAPostThatLeadsNowhere) {
  const auto collector = start("127.0.0.1:0", _server.certificateFile, {"--uploads", _scratch.at("uploads")});
  const std::string served = address(*collector);
  ASSERT_NE(served, "");
  const auto answerTo = [&served](const char* path, const char* method = "POST") {
    ManualUpload post(served, path, 1, method);
    post.send("x");
    return post.answerUntil(kHeadsEnd);
  };
  EXPECT_THAT(answerTo("/logs"), MatchesRegex(std::string("HTTP/1.1 404 ") + kNoBody));
  EXPECT_THAT(answerTo("/logdata/"), MatchesRegex(std::string("HTTP/1.1 404 ") + kNoBody));
  EXPECT_THAT(answerTo("/statistics"), MatchesRegex(std::string("HTTP/1.1 405 ") + kNoBody));
  EXPECT_THAT(answerTo("/logdata", "PUT"), MatchesRegex(std::string("HTTP/1.1 405 ") + kNoBody));
  EXPECT_THAT(ManualUpload(served, "/logdata", 0).answerUntil(kHeadsEnd),
              MatchesRegex(std::string("HTTP/1.1 400 ") + kNoBody));
  EXPECT_THAT(ManualUpload(served, "/logs", 0, "GET").answerUntil("here\n"), HasSubstr("nothing is served here\n"))
      << "who asks is told";
}

TEST_F(CollectorProgramTest, leavesNoHalfOfAnUploadBehindWhenItIsKilled) {
  const std::string folder = _scratch.at("uploads");
  const auto collector = start("127.0.0.1:0", _server.certificateFile, {"--uploads", folder});
  const std::string served = address(*collector);
  ASSERT_NE(served, "");
  ManualUpload upload(served, "/upload?filename=log&raw=true", 2'000'000);
  upload.send(std::string(1'000'000, 'x'));
  // Its file is open, somewhere below the folder, and has come so far.
  const auto isReceiving = [&] {
    for (const auto& open : fs::directory_iterator("/proc/" + std::to_string(collector->pid()) + "/fd")) {
      std::error_code gone;
      const std::string target = fs::read_symlink(open.path(), gone).string();
      if (target.starts_with(folder + "/") && fs::file_size(open.path(), gone) > 500'000) return true;
    }
    return false;
  };
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(20);
  while (!isReceiving() && std::chrono::steady_clock::now() < deadline) std::this_thread::yield();
  ASSERT_TRUE(isReceiving());
  collector->signal(SIGKILL);
  EXPECT_EQ(collector->wait(), -SIGKILL);
  EXPECT_TRUE(fs::is_empty(folder)) << fs::directory_iterator(folder)->path();
}

}  // namespace
}  // namespace telvane::testing
