// That docs/dashboard-protocol.md says what is sent: its examples byte for byte, its schedule period for period.
#include <gmock/gmock.h>

#include <sstream>

#include "tests/backends/DashboardFixture.h"
#include "tests/backends/ProtocolPage.h"

namespace telvane::testing {
namespace {

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

  const ProtocolPage _page{"dashboard-protocol.md"};
};

TEST_F(DashboardProtocolTest, theExampleIsADatagramByteForByte) {
  sendExample();
  ASSERT_EQ(dashboard().arrivals().size(), 1u);
  EXPECT_EQ(_page.example("datagram"), hexadecimal(dashboard().arrivals().front().bytes));
}

TEST_F(DashboardProtocolTest, theLineIsWhatTheClientGets) { EXPECT_EQ(sendExample(), String(_page.example("line"))); }

TEST_F(DashboardProtocolTest, theLogDataArePostedAsThePageSays) {
  _profile.set(kProfilePostURL, "https://collector.example/logdata");
  make();
  const auto session = _process.platform().dispatch.newSerialQueue("session");
  session->async([this] { backend().uploadLogData(Array{Dictionary{{Key("text"), "hi"}}}); });
  _world.runUntilIdle();
  ASSERT_EQ(_connectivity->count(), 1u);
  const URLRequest request = _connectivity->lastRequest();
  EXPECT_EQ(request.url, "https://collector.example/logdata") << "as the profile has it";
  EXPECT_EQ(request.method, "POST");
  EXPECT_EQ(_page.example("log data headers"), headerLines(request));
  EXPECT_EQ(_page.example("archive"), hexadecimal({request.body.bytes(), request.body.size()}));
  log().expectError("DashboardBackend(uploadLogData): Error uploading log data array ((null))");
  _connectivity->answer(0, 200);
  _world.runUntilIdle();
}

TEST_F(DashboardProtocolTest, theScheduleIsThatOfTheBackend) {
  sendExample();
  tick(40);
  std::vector<int64_t> periods;
  std::istringstream rows(_page.section("The schedule"));
  for (std::string row; std::getline(rows, row);) {
    if (row.starts_with("| ") && row.find("sent") != std::string::npos) periods.push_back(std::stoi(row.substr(2)));
  }
  EXPECT_EQ(periods, arrivalPeriods());
}

}  // namespace
}  // namespace telvane::testing
