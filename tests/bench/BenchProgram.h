#pragma once

#include <gtest/gtest.h>

#include <cstdlib>
#include <string>
#include <utility>
#include <vector>

#include "tests/support/ChildProcess.h"
#include "tests/support/ScratchFolder.h"

namespace telvane::testing {

// A measuring program of bench/, run to its end.
class BenchProgramTest : public ::testing::Test {
 protected:
  // name: what follows telvane-bench-.
  explicit BenchProgramTest(std::string name) : _name(std::move(name)) {}

  // Returns the exit status.
  int run(std::vector<std::string> arguments) {
    arguments.insert(arguments.begin(), std::string(TELVANE_PROGRAM_DIR) + "/telvane-bench-" + _name);
    const char* folder = std::getenv("TMPDIR");
    const std::vector<std::string> environment{"TMPDIR=" + std::string(folder != nullptr ? folder : "/tmp")};
    ChildProcess program(arguments, environment, {_scratch.at("out"), _scratch.at("err")});
    return program.wait(std::chrono::seconds(100));
  }
  std::string output() const { return _scratch.read("out"); }
  std::string errors() const { return _scratch.read("err"); }

 private:
  const std::string _name;
  ScratchFolder _scratch;
};

}  // namespace telvane::testing
