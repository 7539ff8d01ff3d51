// That docs/dashboard-protocol.md says what is sent: its examples byte for byte, its schedule period for period.
#include <gmock/gmock.h>

#include <fstream>
#include <iterator>
#include <sstream>

#include "platform/KeyedArchive.h"
#include "tests/backends/DashboardFixture.h"

namespace telvane::testing {
namespace {

std::string document() {
  std::ifstream file(TELVANE_SOURCE_DIR "/docs/dashboard-protocol.md");
  return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
}

std::string between(const std::string& text, const std::string& start, const std::string& end) {
  const size_t from = text.find(start);
  if (from == std::string::npos) return "";
  const size_t begin = from + start.size();
  return text.substr(begin, text.find(end, begin) - begin);
}

std::string example(const std::string& name) {
  return between(document(), "<!-- example: " + name + " -->\n```\n", "\n```\n");
}

// Sixteen bytes to a line, as the page writes them.
std::string hexadecimal(std::span<const uint8_t> bytes) {
  std::string text;
  for (size_t at = 0; at < bytes.size(); ++at) {
    if (at != 0) text += at % 16 == 0 ? '\n' : ' ';
    text += fmt::format("{:02x}", bytes[at]);
  }
  return text;
}

class DashboardProtocolTest : public DashboardFixture {
 protected:
  std::optional<String> sendExample() {
    givenReliable();
    make();
    auto line = backend().sendMessage(Dictionary{{Key("name"), "a=b"}, {Key("ok"), true}},
                                      Date(Date::TimePoint(std::chrono::microseconds(12'345'678))), uint16_t{7},
                                      uint16_t{2}, uint16_t{258});
    _world.runUntilIdle();
    return line;
  }
};

TEST_F(DashboardProtocolTest, theExampleIsADatagramByteForByte) {
  sendExample();
  ASSERT_EQ(dashboard().arrivals().size(), 1u);
  EXPECT_EQ(example("datagram"), hexadecimal(dashboard().arrivals().front().bytes));
}

TEST_F(DashboardProtocolTest, theLineIsWhatTheClientGets) { EXPECT_EQ(sendExample(), String(example("line"))); }

TEST_F(DashboardProtocolTest, theArchiveIsThatOfItsArray) {
  const auto archive = keyedarchive::archive(Array{Dictionary{{Key("text"), "hi"}}});
  ASSERT_TRUE(archive.has_value());
  EXPECT_EQ(example("archive"), hexadecimal({archive->bytes(), archive->size()}));
}

TEST_F(DashboardProtocolTest, theScheduleIsThatOfTheBackend) {
  sendExample();
  tick(40);
  std::vector<int64_t> periods;
  std::istringstream rows(between(document(), "\n## The schedule\n", "\n## "));
  for (std::string row; std::getline(rows, row);) {
    if (row.starts_with("| ") && row.find("sent") != std::string::npos) periods.push_back(std::stoi(row.substr(2)));
  }
  EXPECT_EQ(periods, arrivalPeriods());
}

}  // namespace
}  // namespace telvane::testing
