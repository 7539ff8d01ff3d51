#include "collector/CollectorOptions.h"

#include <gtest/gtest.h>

#include <vector>

namespace telvane::testing {
namespace {

std::variant<CollectorOptions, int> parse(std::vector<const char*> arguments) {
  arguments.insert(arguments.begin(), "telvane-collector");
  return parseCollectorOptions(static_cast<int>(arguments.size()), arguments.data());
}

std::vector<const char*> complete(const char* address) {
  return {"--listen", address, "--certificate", "c", "--private-key", "k", "--storebags", "s", "--events", "e"};
}

int statusOf(const std::vector<const char*>& arguments) {
  const auto parsed = parse(arguments);
  const int* status = std::get_if<int>(&parsed);
  return status != nullptr ? *status : -1;
}

TEST(CollectorOptionsTest, readsEveryOption) {
  auto arguments = complete("127.0.0.1:8443");
  arguments.insert(arguments.end(), {"--max-age", "60", "--uploads", "u"});
  const auto parsed = parse(arguments);
  const auto* options = std::get_if<CollectorOptions>(&parsed);
  ASSERT_NE(options, nullptr);
  EXPECT_EQ(options->host, "127.0.0.1");
  EXPECT_EQ(options->port, 8443);
  EXPECT_EQ(options->certificateFile, "c");
  EXPECT_EQ(options->privateKeyFile, "k");
  EXPECT_EQ(options->storebagFolder, "s");
  EXPECT_EQ(options->eventFile, "e");
  EXPECT_EQ(options->uploadFolder, "u");
  EXPECT_EQ(options->maxAge, std::chrono::seconds(60));
}

TEST(CollectorOptionsTest, takesTheLastColonForThePort) {
  const auto parsed = parse(complete("::1:0"));
  const auto* options = std::get_if<CollectorOptions>(&parsed);
  ASSERT_NE(options, nullptr);
  EXPECT_EQ(options->host, "::1");
  EXPECT_EQ(options->port, 0);
}

TEST(CollectorOptionsTest, refusesAnAddressThatIsNone) {
  for (const char* address : {"", "127.0.0.1", ":80", "127.0.0.1:", "127.0.0.1:65536", "127.0.0.1:-1", "h:8x"}) {
    EXPECT_EQ(statusOf(complete(address)), 2) << "--listen \"" << address << "\"";
  }
}

TEST(CollectorOptionsTest, wantsAnEventFileOrDiscardAndNotBoth) {
  std::vector<const char*> arguments = complete("127.0.0.1:0");
  arguments.push_back("--discard");
  EXPECT_EQ(statusOf(arguments), 2) << "both";
  arguments.erase(arguments.end() - 3, arguments.end());
  EXPECT_EQ(statusOf(arguments), 2) << "neither";
  arguments.push_back("--discard");
  const auto parsed = parse(arguments);
  const auto* options = std::get_if<CollectorOptions>(&parsed);
  ASSERT_NE(options, nullptr);
  EXPECT_EQ(options->eventFile, "");
}

TEST(CollectorOptionsTest, refusesWhatItDoesNotKnow) {
  EXPECT_EQ(statusOf({}), 2);
  EXPECT_EQ(statusOf({"--nonsense"}), 2);
  auto negative = complete("127.0.0.1:0");
  negative.insert(negative.end(), {"--max-age", "-1"});
  EXPECT_EQ(statusOf(negative), 2);
}

TEST(CollectorOptionsTest, takesDashboardDatagramsWhereItIsAskedTo) {
  const auto with = [](std::vector<const char*> more) {
    auto arguments = complete("127.0.0.1:0");
    arguments.insert(arguments.end(), more.begin(), more.end());
    return arguments;
  };
  const auto none = parse(complete("127.0.0.1:0"));
  EXPECT_EQ(std::get<CollectorOptions>(none).dashboard, std::nullopt);
  const auto parsed = parse(with({"--dashboard", "127.0.0.1:9000", "--dashboard-loss", "30", "--dashboard-seed", "7"}));
  const auto* options = std::get_if<CollectorOptions>(&parsed);
  ASSERT_NE(options, nullptr);
  EXPECT_EQ(options->dashboard, (IPv4SocketAddress{{127, 0, 0, 1}, 9000}));
  EXPECT_EQ(options->dashboardLossPercent, 30u);
  EXPECT_EQ(options->dashboardLossSeed, 7u);
  for (const char* address : {"", "9000", "localhost:0", "::1:0", "127.0.0.1", "127.0.0.1:65536", "0127.0.0.1:1"}) {
    EXPECT_EQ(statusOf(with({"--dashboard", address})), 2) << address;
  }
  EXPECT_EQ(statusOf(with({"--dashboard", "127.0.0.1:0", "--dashboard-loss", "101"})), 2);
  EXPECT_EQ(statusOf(with({"--dashboard", "127.0.0.1:0", "--dashboard-loss", "-1"})), 2);
  EXPECT_EQ(statusOf(with({"--dashboard-loss", "30"})), 2) << "of what?";
}

TEST(CollectorOptionsTest, hasHelpAndVersion) {
  EXPECT_EQ(statusOf({"--help"}), 0);
  EXPECT_EQ(statusOf({"--version"}), 0);
}

}  // namespace
}  // namespace telvane::testing
