#include "platform/system/PropertyListUserDefaults.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <thread>

#include "platform/PropertyList.h"
#include "tests/platform/system/Expect.h"
#include "tests/support/RecordingLog.h"
#include "tests/support/ScratchFolder.h"

namespace telvane {
namespace {

using telvane::testing::failsWith;
using telvane::testing::holds;
using telvane::testing::RecordingLog;
using telvane::testing::succeeds;

constexpr const char* kSuite = "com.corvex.test";
constexpr const char* kUserFile = "home/Library/Preferences/com.corvex.test.plist";
constexpr const char* kSystemFile = "root/etc/telvane/defaults/com.corvex.test.plist";

class PropertyListUserDefaultsTest : public ::testing::Test {
 protected:
  Paths paths() const { return {.root = _folder.at("root"), .home = _folder.at("home")}; }
  void givenFile(const char* name, const Value& content) {
    _folder.write(name, propertylist::serialize(content, propertylist::Format::XML)->view());
  }
  Value stored(const char* name = kUserFile) {
    const Result<Value> content = propertylist::parse(Data(_folder.read(name)));
    return content ? *content : Value();
  }

  // Runs the work in another process and returns its pid.
  template <class Work>
  pid_t inAnotherProcess(Work work) {
    const pid_t child = ::fork();
    if (child != 0) return child;
    RecordingLog log;
    log.allowErrors();
    PropertyListUserDefaults defaults(paths(), log);
    ::_exit(work(defaults) ? 0 : 1);
  }
  static bool endedWell(pid_t child) {
    int status = 0;
    return ::waitpid(child, &status, 0) == child && WIFEXITED(status) && WEXITSTATUS(status) == 0;
  }

  testing::ScratchFolder _folder;
  RecordingLog _log;
  PropertyListUserDefaults _defaults{paths(), _log};
};

TEST_F(PropertyListUserDefaultsTest, hasNothingBeforeAnythingIsSet) {
  EXPECT_TRUE(holds(_defaults.objectForKey(kSuite, "a"), Value()));
  EXPECT_TRUE(_defaults.dictionaryRepresentation(kSuite).empty());
  EXPECT_FALSE(std::filesystem::exists(_folder.at("home"))) << "asking makes no folder";
}

TEST_F(PropertyListUserDefaultsTest, keepsKindsAndOtherKeys) {
  ASSERT_TRUE(succeeds(_defaults.setObject(kSuite, "a", true)));
  ASSERT_TRUE(succeeds(_defaults.setObject(kSuite, "b", 1.0)));
  ASSERT_TRUE(succeeds(_defaults.setObject(kSuite, "c", Dictionary{{"k", Data::copyOf("x")}})));
  const Value all = Dictionary{{"a", true}, {"b", 1.0}, {"c", Dictionary{{"k", Data::copyOf("x")}}}};
  EXPECT_TRUE(holds(_defaults.dictionaryRepresentation(kSuite), all));
  EXPECT_TRUE(holds(stored(), all));
  RecordingLog log;
  EXPECT_TRUE(holds(PropertyListUserDefaults(paths(), log).objectForKey(kSuite, "b"), Value(1.0)));
}

TEST_F(PropertyListUserDefaultsTest, keepsSuitesApart) {
  ASSERT_TRUE(succeeds(_defaults.setObject(kSuite, "a", 1)));
  EXPECT_TRUE(holds(_defaults.objectForKey("com.corvex.other", "a"), Value()));
}

TEST_F(PropertyListUserDefaultsTest, removesAKeyThatIsSetToNothing) {
  ASSERT_TRUE(succeeds(_defaults.setObject(kSuite, "a", 1)));
  ASSERT_TRUE(succeeds(_defaults.setObject(kSuite, "b", 2)));
  ASSERT_TRUE(succeeds(_defaults.setObject(kSuite, "a", Value())));
  EXPECT_TRUE(holds(stored(), Dictionary{{"b", 2}}));
}

TEST_F(PropertyListUserDefaultsTest, looksASystemWideValueUpWhereTheUserHasNone) {
  givenFile(kSystemFile, Dictionary{{"a", 1}, {"b", 2}});
  ASSERT_TRUE(succeeds(_defaults.setObject(kSuite, "a", 10)));
  EXPECT_TRUE(holds(_defaults.objectForKey(kSuite, "a"), 10));
  EXPECT_TRUE(holds(_defaults.objectForKey(kSuite, "b"), 2));
  EXPECT_TRUE(holds(_defaults.dictionaryRepresentation(kSuite), Dictionary{{"a", 10}, {"b", 2}}));
  ASSERT_TRUE(succeeds(_defaults.setObject(kSuite, "a", Value())));
  EXPECT_TRUE(holds(_defaults.objectForKey(kSuite, "a"), 1));
  EXPECT_TRUE(holds(stored(kSystemFile), Dictionary{{"a", 1}, {"b", 2}}));
}

TEST_F(PropertyListUserDefaultsTest, seesWhatAnotherProcessChanged) {
  ASSERT_TRUE(succeeds(_defaults.setObject(kSuite, "a", 1)));
  EXPECT_TRUE(holds(_defaults.objectForKey(kSuite, "a"), 1));
  for (int round = 2; round < 20; ++round) {
    EXPECT_TRUE(endedWell(
        inAnotherProcess([round](UserDefaults& theirs) { return theirs.setObject(kSuite, "a", round).has_value(); })));
    EXPECT_TRUE(holds(_defaults.objectForKey(kSuite, "a"), round));
  }
}

TEST_F(PropertyListUserDefaultsTest, seesAFileThatWasEditedInPlace) {
  ASSERT_TRUE(succeeds(_defaults.setObject(kSuite, "a", 1)));
  for (int round = 10; round < 30; ++round) {  // the same size each time, and often the same tick of the clock
    givenFile(kUserFile, Dictionary{{"a", round}});
    EXPECT_TRUE(holds(_defaults.objectForKey(kSuite, "a"), round));
  }
}

// Several processes add keys of their own to one suite while this one reads it: every key is there in the end, and no
// reading ever finds garbage.
TEST_F(PropertyListUserDefaultsTest, losesNoKeyAndIsNeverSeenHalfWrittenWhenProcessesWriteAtOnce) {
  constexpr int kProcesses = 3;
  constexpr int kKeys = 40;
  std::vector<pid_t> children;
  for (int process = 0; process < kProcesses; ++process) {
    children.push_back(inAnotherProcess([process](UserDefaults& theirs) {
      bool isGood = true;
      for (int key = 0; key < kKeys; ++key) {
        const std::string name = fmt::format("{}-{}", process, key);
        isGood = theirs.setObject(kSuite, name, std::string(2000, 'x')).has_value() && isGood;
      }
      return isGood;
    }));
  }
  size_t last = 0;
  while (last < kProcesses * kKeys / 2) {
    const size_t now = _defaults.dictionaryRepresentation(kSuite).size();
    ASSERT_GE(now, last);
    last = now;
  }
  for (const pid_t child : children) EXPECT_TRUE(endedWell(child));
  EXPECT_EQ(_defaults.dictionaryRepresentation(kSuite).size(), size_t{kProcesses} * kKeys);
  EXPECT_EQ(_log.count(LogLevel::Error, ""), 0u);
}

TEST_F(PropertyListUserDefaultsTest, losesNoKeyWhenThreadsWriteAtOnce) {
  std::vector<std::thread> threads;
  for (int thread = 0; thread < 4; ++thread) {
    threads.emplace_back([this, thread] {
      for (int key = 0; key < 10; ++key) {
        EXPECT_TRUE(succeeds(_defaults.setObject(kSuite, fmt::format("{}-{}", thread, key), key)));
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(_defaults.dictionaryRepresentation(kSuite).size(), 40u);
}

TEST_F(PropertyListUserDefaultsTest, makesAValueOnceForAllProcesses) {
  std::vector<pid_t> children;
  for (int process = 0; process < 4; ++process) {
    children.push_back(inAnotherProcess([](UserDefaults& theirs) {
      const Value mine = theirs.objectForKeyOrStore(kSuite, "id", []() -> Value { return std::to_string(::getpid()); });
      return mine == theirs.objectForKey(kSuite, "id");
    }));
  }
  for (const pid_t child : children) EXPECT_TRUE(endedWell(child)) << "a process was given another value than was kept";
  const Value kept = _defaults.objectForKey(kSuite, "id");
  bool wasAsked = false;
  EXPECT_TRUE(
      holds(_defaults.objectForKeyOrStore(kSuite, "id", [&wasAsked]() -> Value { return wasAsked = true; }), kept));
  EXPECT_FALSE(wasAsked);
}

TEST_F(PropertyListUserDefaultsTest, givesTheMadeValueAlsoWhenItCannotBeStored) {
  _folder.write("home", "a file where the folder should be");
  _log.expectError("Cannot store id");
  EXPECT_TRUE(holds(_defaults.objectForKeyOrStore(kSuite, "id", []() -> Value { return 7; }), 7));
  EXPECT_FALSE(_defaults.setObject(kSuite, "a", 1).has_value());
}

TEST_F(PropertyListUserDefaultsTest, countsGarbageAsEmptyWithOneErrorLineAndKeepsItAside) {
  _folder.write(kUserFile, "garbage");
  _log.expectError("counts as empty");
  for (int i = 0; i < 3; ++i) EXPECT_TRUE(holds(_defaults.objectForKey(kSuite, "a"), Value()));
  EXPECT_EQ(_log.count(LogLevel::Error, kUserFile), 1u);
  EXPECT_EQ(_folder.read(kUserFile), "garbage") << "reading destroys nothing";
  ASSERT_TRUE(succeeds(_defaults.setObject(kSuite, "a", 1)));
  EXPECT_TRUE(holds(stored(), Dictionary{{"a", 1}}));
  EXPECT_EQ(_folder.read(std::string(kUserFile) + ".corrupt"), "garbage");
  EXPECT_EQ(_log.count(LogLevel::Error, ""), 1u);
}

TEST_F(PropertyListUserDefaultsTest, reportsEachGarbageContentOfItsOwn) {
  _log.expectError("counts as empty");
  _folder.write(kUserFile, "garbage");
  _defaults.objectForKey(kSuite, "a");
  givenFile(kUserFile, Array{"no dictionary"});
  _defaults.objectForKey(kSuite, "a");
  _folder.write(kSystemFile, "<plist>");
  _defaults.objectForKey(kSuite, "a");
  _defaults.dictionaryRepresentation(kSuite);
  EXPECT_EQ(_log.count(LogLevel::Error, "counts as empty"), 3u) << _log.text();
  EXPECT_EQ(_log.count(LogLevel::Error, "root is no dictionary"), 1u);
}

TEST_F(PropertyListUserDefaultsTest, doesNotReplaceWhatItCannotRead) {
  std::filesystem::create_directories(_folder.at(kUserFile));
  _log.expectError("counts as empty");
  EXPECT_TRUE(holds(_defaults.objectForKey(kSuite, "a"), Value()));
  EXPECT_TRUE(failsWith(_defaults.setObject(kSuite, "a", 1), EACCES));
  EXPECT_TRUE(std::filesystem::is_directory(_folder.at(kUserFile)));
}

TEST_F(PropertyListUserDefaultsTest, refusesNamesThatLeadOutOfTheFolder) {
  _folder.write("home/Library/secret.plist",
                propertylist::serialize(Dictionary{{"a", 1}}, propertylist::Format::XML)->view());
  for (const std::string_view suite :
       {std::string_view("../secret"), std::string_view("a/b"), std::string_view(".hidden"), std::string_view(""),
        std::string_view("a\0b", 3), std::string_view("/etc/x")}) {
    EXPECT_TRUE(holds(_defaults.objectForKey(suite, "a"), Value())) << suite;
    EXPECT_TRUE(_defaults.dictionaryRepresentation(suite).empty()) << suite;
    EXPECT_TRUE(failsWith(_defaults.setObject(suite, "a", 1), EINVAL)) << suite;
  }
  EXPECT_TRUE(failsWith(_defaults.setObject(std::string(201, 'x'), "a", 1), EINVAL));
}

TEST_F(PropertyListUserDefaultsTest, refusesAValueThatAListCannotHoldAndKeepsTheOldOnes) {
  ASSERT_TRUE(succeeds(_defaults.setObject(kSuite, "a", 1)));
  Array withAbsent;
  withAbsent.append(Value());
  EXPECT_TRUE(failsWith(_defaults.setObject(kSuite, "b", withAbsent), EINVAL));
  EXPECT_TRUE(holds(stored(), Dictionary{{"a", 1}}));
}

// One entry of 17 MiB was once written, found too large by the next reader, and taken for garbage by the next writer.
TEST_F(PropertyListUserDefaultsTest, refusesWhatItCouldNotReadBackAndKeepsTheOldEntries) {
  ASSERT_TRUE(succeeds(_defaults.setObject(kSuite, "a", 1)));
  const std::string before = _folder.read(kUserFile);
  EXPECT_TRUE(failsWith(_defaults.setObject(kSuite, "b", std::string(17u << 20, 'x')), EFBIG));
  EXPECT_TRUE(failsWith(_defaults.setObject(kSuite, std::string(17u << 20, 'k'), 1), EFBIG));
  EXPECT_EQ(_folder.read(kUserFile), before);
  ASSERT_TRUE(succeeds(_defaults.setObject(kSuite, "c", 3)));
  EXPECT_TRUE(holds(stored(), Dictionary{{"a", 1}, {"c", 3}}));
  EXPECT_FALSE(std::filesystem::exists(_folder.at(kUserFile) + ".corrupt"));
}

TEST_F(PropertyListUserDefaultsTest, letsOnlyTheUserReadTheFile) {
  ASSERT_TRUE(succeeds(_defaults.setObject(kSuite, "a", 1)));
  struct stat status {};
  ASSERT_EQ(::stat(_folder.at(kUserFile).c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 0777, 0600u);
}

}  // namespace
}  // namespace telvane
