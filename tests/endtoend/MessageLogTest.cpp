// The message log of a real daemon, in real files.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>

#include <filesystem>

#include "interfaces/StorebagKeys.h"
#include "tests/endtoend/Instance.h"

namespace telvane::testing {
namespace {

namespace fs = std::filesystem;
using ::testing::HasSubstr;
using ::testing::MatchesRegex;

constexpr char kRetired[] = "root/var/mobile/Library/Logs/CrashReporter/Retired";

class MessageLogTest : public ::testing::Test {
 protected:
  MessageLogTest() { instance.startCollector(); }
  // The user's consent counts, or the bag does not ask for it.
  void startDaemon(bool respectsConsent) {
    Dictionary bag = openBag(instance.collectorURL("/events"));
    if (respectsConsent) bag = withoutOverride(bag);
    instance.givenStorebag("conferencing", bag);
    instance.givenConsent(true);
    instance.startDaemon();
  }
  static Dictionary withoutOverride(const Dictionary& bag) {
    const Dictionary& section = *bag[kEnvironmentRelease].dictionary();
    const Dictionary& profile = *section["splunk"].dictionary();
    Dictionary client = *(*profile[kProfileClients].array())[0].dictionary();
    client.set(kClientEntryOverrideDNU, Value());
    Dictionary changed = bag;
    changed.set(kEnvironmentRelease, Dictionary{{Key("splunk"), Dictionary{{kProfileClients, Array{Value(client)}}}}});
    return changed;
  }
  std::vector<std::string> files() const {
    std::vector<std::string> names;
    if (!fs::exists(instance.path(kRetired))) return names;
    for (const auto& entry : fs::directory_iterator(instance.path(kRetired))) {
      names.push_back(entry.path().filename().string());
    }
    return names;
  }
  std::string theFile() const {
    const std::vector<std::string> names = files();
    EXPECT_EQ(names.size(), 1u) << instance.daemonLog();
    return names.empty() ? "" : std::string(kRetired) + "/" + names[0];
  }
  static size_t count(const std::string& text, const std::string& part) {
    size_t found = 0;
    for (size_t at = text.find(part); at != std::string::npos; at = text.find(part, at + 1)) ++found;
    return found;
  }
  Instance instance;
};

TEST_F(MessageLogTest, aFlushedBatchStandsInTheFileOfTheDay) {
  startDaemon(true);
  EXPECT_THAT(instance.sendEvents({"--count", "3"}), HasSubstr("flushed: ok"));
  const std::string file = theFile();
  EXPECT_THAT(fs::path(file).filename().string(),
              MatchesRegex("telvaned_[0-9]{4}-[0-9]{2}-[0-9]{2}-[0-9]{2}-[0-9]{2}-[0-9]{2}_messageLog.ips"));
  EXPECT_EQ(fs::status(instance.path(file)).permissions(), fs::perms(0600));
  const std::string text = instance.read(file);
  EXPECT_THAT(text.substr(0, text.find('\n')),
              MatchesRegex("\\([0-9]{4}-[0-9]{2}-[0-9]{2} [0-9]{2}:[0-9]{2}:[0-9]{2} \\+0000\\) "
                           "\\[splunk -> flushMessages\\] \\{"));
  for (const char* event : {"\"event 0\"", "\"event 1\"", "\"event 2\""}) EXPECT_THAT(text, HasSubstr(event));
  EXPECT_TRUE(eventually([&] {
    return instance.daemonLogHas("writeToLogFile: Saved log message to " + instance.path(file));
  })) << instance.daemonLog();
}

TEST_F(MessageLogTest, theNextDaemonGoesOnWithTheSameFile) {
  startDaemon(true);
  instance.sendEvents({});
  const std::string file = theFile();
  instance.daemon().signal(SIGTERM);
  instance.daemon().wait();
  const size_t before = count(instance.read(file), "[splunk -> flushMessages]");
  instance.startDaemon();
  instance.sendEvents({});
  EXPECT_EQ(theFile(), file);
  EXPECT_GT(count(instance.read(file), "[splunk -> flushMessages]"), before);
}

TEST_F(MessageLogTest, eventsOfABagThatOverridesConsentAreOnNoDisk) {
  startDaemon(false);
  EXPECT_THAT(instance.sendEvents({"--count", "3"}), HasSubstr("flushed: ok"));
  instance.daemon().signal(SIGTERM);
  instance.daemon().wait();
  EXPECT_TRUE(eventually([&] { return instance.arrivedWithCategory(21).size() == 3; })) << instance.daemonLog();
  EXPECT_TRUE(files().empty());
}

}  // namespace
}  // namespace telvane::testing
