// The demonstration as a newcomer sees it, with the programs of this build.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>

#include "tests/support/ChildProcess.h"
#include "tests/support/ScratchFolder.h"

namespace telvane::testing {
namespace {

namespace fs = std::filesystem;
using ::testing::ContainsRegex;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

std::string contentOf(const fs::path& path) {
  std::ostringstream text;
  text << std::ifstream(path, std::ios::binary).rdbuf();
  return text.str();
}

class DemoTest : public ::testing::Test {
 protected:
  // Runs it in a folder for scratch files of its own; returns the exit status.
  int run(const std::vector<std::string>& options = {}) {
    fs::create_directories(scratch.at("tmp"));
    std::vector<std::string> arguments{"/bin/sh", TELVANE_SOURCE_DIR "/scripts/demo", "--programs",
                                       TELVANE_PROGRAM_DIR};
    arguments.insert(arguments.end(), options.begin(), options.end());
    ChildProcess demo(arguments, environment(), {.output = scratch.at("out"), .errors = scratch.at("err")});
    return demo.wait();
  }
  std::vector<std::string> environment() const {
    std::vector<std::string> variables{"TMPDIR=" + scratch.at("tmp")};
    // The sanitizers' options, and what finds shared objects.
    for (const char* name : {"PATH", "LD_LIBRARY_PATH", "ASAN_OPTIONS", "UBSAN_OPTIONS", "TSAN_OPTIONS"}) {
      if (const char* value = std::getenv(name)) variables.push_back(std::string(name) + "=" + value);
    }
    return variables;
  }
  std::string shown() const { return scratch.read("out"); }
  std::string complaints() const { return scratch.read("err"); }
  std::vector<std::string> leftFiles() const {
    std::vector<std::string> names;
    for (const auto& entry : fs::directory_iterator(scratch.at("tmp"))) names.push_back(entry.path().filename());
    return names;
  }
  // The command lines of processes that were started in the scratch folder.
  std::vector<std::string> leftProcesses() const {
    std::vector<std::string> commands;
    for (const auto& entry : fs::directory_iterator("/proc")) {
      const bool isOurs = contentOf(entry.path() / "environ").find(scratch.at("tmp")) != std::string::npos;
      if (isOurs) commands.push_back(contentOf(entry.path() / "cmdline"));
    }
    return commands;
  }

  ScratchFolder scratch;
};

TEST_F(DemoTest, showsThreeActsAndLeavesNothingBehind) {
  ASSERT_EQ(run(), 0) << shown() << complaints();
  EXPECT_THAT(shown(), HasSubstr("5 events of example-c arrived\n"));
  EXPECT_THAT(shown(), HasSubstr("5 events of example-cpp arrived\n"));
  EXPECT_THAT(shown(), HasSubstr("the event arrived once: under the bag that enables its backend\n"));
  // The third act.
  EXPECT_THAT(shown(), ContainsRegex("upload call\\.log\\.gz [0-9]+ bytes"));
  EXPECT_THAT(shown(), HasSubstr("12:00:00.1 call 7: packet 1 received"));
  EXPECT_THAT(shown(), HasSubstr("arrived byte for byte, and gone from its place"));
  EXPECT_THAT(shown(), HasSubstr("enabled backends: splunk, dashboard, upload_server\n"));
  EXPECT_THAT(shown(),
              ContainsRegex("[1-9][0-9]* datagrams and acknowledgements got lost on the way; all 20 events are"));
  EXPECT_THAT(shown(), ContainsRegex("made [1-9][0-9]* reports, flushed\n"));
  EXPECT_THAT(shown(), ContainsRegex("\"process\":\\{.*\"residentKilobytes\":[1-9]"));
  EXPECT_THAT(
      shown(),
      ContainsRegex("1 log, 20 events on the dashboard and as many posts of them, [1-9][0-9]* reports of metrics"));
  EXPECT_EQ(complaints(), "");
  EXPECT_THAT(leftFiles(), IsEmpty());
  EXPECT_THAT(leftProcesses(), IsEmpty());
}

TEST_F(DemoTest, saysInOneLineWhatItLacks) {
  EXPECT_EQ(run({"--programs", scratch.path()}), 1);
  EXPECT_EQ(complaints(), "demo: there is no " + scratch.path() + "/telvaned; build it, or leave out --programs\n");
  EXPECT_THAT(leftFiles(), IsEmpty());
  EXPECT_EQ(run({"--unknown"}), 2);
}

}  // namespace
}  // namespace telvane::testing
