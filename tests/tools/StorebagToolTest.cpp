#include "tools/StorebagTool.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <sstream>

#include "platform/system/PosixFileSystem.h"
#include "tests/support/ScratchFolder.h"

namespace telvane::testing {
namespace {

using ::testing::HasSubstr;
using ::testing::StartsWith;

class StorebagToolTest : public ::testing::Test {
 protected:
  // Runs the program with these arguments, of which those with a leading '@' name files of the scratch folder.
  int run(std::vector<std::string> arguments) {
    _output.str("");
    _errors.str("");
    arguments.insert(arguments.begin(), "telvane-storebag");
    std::vector<const char*> pointers;
    for (std::string& argument : arguments) {
      if (argument.starts_with("@")) argument = _scratch.at(argument.substr(1));
      pointers.push_back(argument.c_str());
    }
    return StorebagTool(_files, _output, _errors).run(static_cast<int>(pointers.size()), pointers.data());
  }
  int keygen(const std::string& name) {
    return run({"keygen", "--private-key", "@" + name + ".pem", "--public-key", "@" + name + ".der"});
  }
  int sign(const std::string& bag) {
    _scratch.write("bag", bag);
    return run({"sign", "--private-key", "@mine.pem", "--input", "@bag", "--output", "@envelope"});
  }
  int verify(const std::string& key) { return run({"verify", "--public-key", "@" + key + ".der", "@envelope"}); }
  void expectOneErrorLine(const std::string& part) {
    EXPECT_THAT(_errors.str(), StartsWith("telvane-storebag: "));
    EXPECT_THAT(_errors.str(), HasSubstr(part));
    EXPECT_EQ(_errors.str().find('\n'), _errors.str().size() - 1) << _errors.str();
    EXPECT_EQ(_output.str(), "");
  }

  ScratchFolder _scratch;
  PosixFileSystem _files{Paths{}};
  std::ostringstream _output;
  std::ostringstream _errors;
};

TEST_F(StorebagToolTest, verifiesAndShowsWhatItSigned) {
  ASSERT_EQ(keygen("mine"), 0) << _errors.str();
  ASSERT_EQ(sign(R"({"version": "7", "refresh_cycle": 60})"), 0) << _errors.str();
  EXPECT_EQ(verify("mine"), 0) << _errors.str();
  EXPECT_EQ(_output.str(), "the signature is good, version 7\n");
  EXPECT_EQ(run({"show", "@envelope"}), 0);
  EXPECT_EQ(_output.str(), "{\n  \"version\": \"7\",\n  \"refresh_cycle\": 60\n}\n");
}

TEST_F(StorebagToolTest, showsAsAPropertyListWhatJSONCannotHold) {
  keygen("mine");
  ASSERT_EQ(sign("<plist><dict><key>version</key><string>1</string><key>d</key><data>AAEC</data></dict></plist>"), 0);
  EXPECT_EQ(run({"show", "@envelope"}), 0);
  EXPECT_THAT(_output.str(), HasSubstr("<data>"));
}

TEST_F(StorebagToolTest, refusesTheSignatureOfAnotherKey) {
  keygen("mine");
  keygen("other");
  sign(R"({"version": "7"})");
  EXPECT_EQ(verify("other"), 1);
  expectOneErrorLine("signature");
}

TEST_F(StorebagToolTest, refusesAnAlteredEnvelope) {
  keygen("mine");
  sign(R"({"version": "7"})");
  std::string envelope = _scratch.read("envelope");
  const size_t at = envelope.find("<string>") + 8 + 20;
  envelope[at] = envelope[at] == 'A' ? 'B' : 'A';
  _scratch.write("envelope", envelope);
  EXPECT_EQ(verify("mine"), 1);
  expectOneErrorLine("altered");
}

TEST_F(StorebagToolTest, keepsTheSigningKeyFromOthersAndDoesNotReplaceIt) {
  ASSERT_EQ(keygen("mine"), 0);
  struct stat status {};
  ASSERT_EQ(stat(_scratch.at("mine.pem").c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 0777, 0600u);
  const std::string key = _scratch.read("mine.pem");
  EXPECT_EQ(keygen("mine"), 1);
  expectOneErrorLine("exists already");
  EXPECT_EQ(_scratch.read("mine.pem"), key);
}

TEST_F(StorebagToolTest, keepsNoPrivateKeyWhosePublicOneCannotBeWritten) {
  const std::vector<std::string> intoAFolderThatIsNotThere{"keygen", "--private-key", "@mine.pem", "--public-key",
                                                           "@bundle/publicKey.der"};
  EXPECT_EQ(run(intoAFolderThatIsNotThere), 1);
  expectOneErrorLine("bundle/publicKey.der");
  EXPECT_NE(access(_scratch.at("mine.pem").c_str(), F_OK), 0) << "the next attempt would be refused";
  std::filesystem::create_directory(_scratch.at("bundle"));
  EXPECT_EQ(run(intoAFolderThatIsNotThere), 0) << _errors.str();
}

TEST_F(StorebagToolTest, signsNoBagThatNoDeviceWouldTake) {
  keygen("mine");
  EXPECT_EQ(sign("[1, 2]"), 1);
  expectOneErrorLine("no dictionary");
  EXPECT_EQ(sign("garbage"), 1);
  expectOneErrorLine("cannot be read");
  EXPECT_EQ(sign("{\"refresh_cycle\": 60}"), 1);
  expectOneErrorLine("version");
  EXPECT_EQ(_scratch.read("envelope"), "");
}

TEST_F(StorebagToolTest, saysHowManyMistakesTheSignedBagHas) {
  keygen("mine");
  ASSERT_EQ(sign("{\"version\": \"1\", \"nonsense\": 1}"), 0);
  EXPECT_THAT(_errors.str(), ::testing::HasSubstr("signed, but lint finds 2 errors in "));
  EXPECT_NE(_scratch.read("envelope"), "");
}

TEST_F(StorebagToolTest, readsJSONWithAByteOrderMarkAndSaysOfAnEmptyFileThatItIs) {
  keygen("mine");
  EXPECT_EQ(sign("\xEF\xBB\xBF{\"version\": \"1\"}"), 0);
  EXPECT_EQ(sign(""), 1);
  expectOneErrorLine("the file is empty");
}

TEST_F(StorebagToolTest, outputThatCannotBeWrittenIsAFailure) {
  keygen("mine");
  ASSERT_EQ(sign("{\"version\": \"1\"}"), 0);
  _scratch.write("bag", "{\"version\": \"1\", \"release\": {}}");
  const std::string bag = _scratch.at("bag");
  const std::string envelope = _scratch.at("envelope");
  for (const auto& [command, file] : {std::pair("lint", bag), {"explain", bag}, {"show", envelope}}) {
    std::ofstream full("/dev/full");
    std::ostringstream errors;
    const char* const arguments[] = {"telvane-storebag", command, file.c_str()};
    EXPECT_EQ(StorebagTool(_files, full, errors).run(3, arguments), 1) << command;
    EXPECT_EQ(errors.str(), "telvane-storebag: cannot write to standard output; see whether its disk is full\n");
  }
}

TEST_F(StorebagToolTest, namesTheFileThatCannotBeUsed) {
  keygen("mine");
  EXPECT_EQ(run({"show", "@nothing"}), 1);
  expectOneErrorLine("nothing");
  _scratch.write("bag", "{\"version\": \"1\"}");
  EXPECT_EQ(run({"sign", "--private-key", "@bag", "--input", "@bag", "--output", "@envelope"}), 1);
  expectOneErrorLine("bag");
  EXPECT_EQ(run({"verify", "--public-key", "@bag", "@bag"}), 1);
  expectOneErrorLine("no public RSA key");
  EXPECT_EQ(run({"show", "@bag"}), 1);
  expectOneErrorLine("envelope");
}

TEST_F(StorebagToolTest, wrongUsageIsTwoAndPointsToTheHelp) {
  const std::vector<std::vector<std::string>> wrong = {{},         {"--nonsense"},           {"nonsense"},
                                                       {"keygen"}, {"sign", "--input", "x"}, {"verify", "x"},
                                                       {"show"},   {"show", "a", "b"}};
  for (const auto& arguments : wrong) {
    EXPECT_EQ(run(arguments), 2) << ::testing::PrintToString(arguments);
    expectOneErrorLine("--help");
  }
}

TEST_F(StorebagToolTest, hasHelpAndVersion) {
  EXPECT_EQ(run({"--help"}), 0);
  EXPECT_THAT(_output.str(), HasSubstr("keygen"));
  EXPECT_EQ(run({"sign", "--help"}), 0);
  EXPECT_THAT(_output.str(), HasSubstr("--private-key"));
  EXPECT_EQ(run({"--version"}), 0);
  EXPECT_THAT(_output.str(), StartsWith("telvane-storebag "));
}

}  // namespace
}  // namespace telvane::testing
