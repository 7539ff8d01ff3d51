#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <sstream>

#include "platform/system/PosixFileSystem.h"
#include "tests/support/ScratchFolder.h"
#include "tests/tools/LintBags.h"
#include "tools/StorebagTool.h"

namespace telvane::testing {
namespace {

using ::testing::HasSubstr;
using ::testing::StartsWith;

class StorebagLintCommandTest : public ::testing::Test {
 protected:
  int lint(const std::string& path) { return run({"telvane-storebag", "lint", path.c_str()}); }
  int run(const std::vector<const char*>& arguments) {
    _output.str("");
    _errors.str("");
    return StorebagTool(_files, _output, _errors).run(static_cast<int>(arguments.size()), arguments.data());
  }
  std::string write(const Value& bag) { return _scratch.write("bag", plist(bag)); }

  ScratchFolder _scratch;
  PosixFileSystem _files{Paths{}};
  std::ostringstream _output;
  std::ostringstream _errors;
};

TEST_F(StorebagLintCommandTest, exitsWithOneOnlyWhenThereIsAnError) {
  EXPECT_EQ(lint(write(bagOf(Array{cleanEntry()}))), 0);
  EXPECT_EQ(_output.str(), "0 errors, 0 warnings\n");
  EXPECT_EQ(lint(write(bagWith("seed", Value()))), 0);
  EXPECT_EQ(_output.str(),
            "warning: seed: is missing: seed devices take release and log an error each time; add it if you have such "
            "devices\n0 errors, 1 warning\n");
  EXPECT_EQ(lint(write(bagWith("version", 5))), 1);
  EXPECT_THAT(_output.str(), StartsWith("error: version: is a number"));
  EXPECT_EQ(_errors.str(), "");
}

TEST_F(StorebagLintCommandTest, takesTheBagsNameFromTheFiles) {
  const Value bag = bagWith("release", Dictionary{{Key("vdr"), Dictionary{{kProfileActive, true}}}});
  for (const char* name : {"media", "bags/media.plist", "media.v2.json"}) {
    EXPECT_EQ(lint(_scratch.write(name, plist(bag))), 0);
    EXPECT_THAT(_output.str(), HasSubstr("warning: release/vdr: is made for the client types 7, 11 and 13 only, and "
                                         "the bag \"media\" is read by 6, 14, 15"))
        << name;
  }
  for (const char* name : {"conferencing.plist", "another.plist", "multimedia"}) {
    EXPECT_EQ(lint(_scratch.write(name, plist(bag))), 0);
    EXPECT_EQ(_output.str(), "0 errors, 0 warnings\n") << name;
  }
}

TEST_F(StorebagLintCommandTest, saysInOneLineWhyAFileCannotBeRead) {
  for (const std::string& path :
       {_scratch.at("nothing"), _scratch.path(), _scratch.write("text", "garbage"), _scratch.write("empty", ""),
        _scratch.write("list", "[1]"), _scratch.write("deep", std::string(1000, '['))}) {
    EXPECT_EQ(lint(path), 1) << path;
    EXPECT_THAT(_errors.str(), StartsWith("telvane-storebag: ")) << path;
    EXPECT_THAT(_errors.str(), HasSubstr("name a property list, JSON or a signed envelope")) << path;
    EXPECT_EQ(_errors.str().find('\n'), _errors.str().size() - 1) << _errors.str();
    EXPECT_EQ(_output.str(), "");
  }
}

TEST_F(StorebagLintCommandTest, wrongUsageIsTwoAndTheHelpSaysSo) {
  EXPECT_EQ(run({"telvane-storebag", "lint"}), 2);
  EXPECT_EQ(run({"telvane-storebag", "lint", "a", "b"}), 2);
  EXPECT_EQ(run({"telvane-storebag", "lint", "--help"}), 0);
  EXPECT_THAT(_output.str(), HasSubstr("Exits 0 without errors, 1 with errors or when the file cannot be read, 2 on "
                                       "wrong usage."));
}

}  // namespace
}  // namespace telvane::testing
