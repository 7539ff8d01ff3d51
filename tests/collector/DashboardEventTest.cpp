#include "collector/DashboardEvent.h"

#include <gmock/gmock.h>

#include "tests/support/Matchers.h"

namespace telvane::testing {
namespace {

using ::testing::HasSubstr;
using ::testing::MatchesRegex;

// A datagram written out by hand: 12.344 s, session 4711, client version 3, 1.2 of category 7 and type 2, event 258.
std::vector<uint8_t> datagram(const std::string& text) {
  const auto length = static_cast<uint16_t>(~(64 + text.size()));
  std::vector<uint8_t> bytes = {8,
                                6,
                                1,
                                86,
                                0,
                                0,
                                0,
                                12,
                                0xFF,
                                0xFF,
                                0xED,
                                0x98,
                                0xFF,
                                0xFC,
                                static_cast<uint8_t>(length >> 8),
                                static_cast<uint8_t>(length),
                                0,
                                7,
                                0,
                                2};
  bytes.insert(bytes.end(), {'d', 'e', 'v'});
  bytes.resize(60, 0);
  bytes.insert(bytes.end(), {1, 2, 0, 1});
  bytes.insert(bytes.end(), text.begin(), text.end());
  return bytes;
}

TEST(DashboardEventTest, readsADatagram) {
  const auto event = DashboardEvent::decode(datagram(" ok=1 name=a\\=b"));
  ASSERT_TRUE(isOk(event));
  EXPECT_EQ(event->dictionary(), (Dictionary{{Key("_method"), 7},
                                             {Key("_status"), 2},
                                             {Key("_eventNumber"), 258},
                                             {Key("_sessionID"), 4711},
                                             {Key("_clientVersion"), 3},
                                             {Key("_clientTS"), 12.344},
                                             {Key("clientType"), 6},
                                             {Key("majorVersion"), 8},
                                             {Key("deviceIdentifier"), "dev"},
                                             {Key("fields"), Dictionary{{Key("ok"), "1"}, {Key("name"), "a=b"}}}}));
  EXPECT_TRUE(event->isReliable);
  EXPECT_TRUE(event->isAddressedByBag);
  EXPECT_EQ(event->line(), "12.344 dev client type 6 session 4711 event 258 method 7 status 2 ok=1 name=a\\=b");
}

TEST(DashboardEventTest, readsFlags) {
  for (const int flags : {0, 1, 2, 3}) {
    auto bytes = datagram("");
    bytes[63] = static_cast<uint8_t>(flags);
    const auto event = DashboardEvent::decode(bytes);
    ASSERT_TRUE(isOk(event));
    EXPECT_EQ(event->isReliable, (flags & 1) != 0);
    EXPECT_EQ(event->isAddressedByBag, (flags & 2) == 0);
  }
}

TEST(DashboardEventTest, refusesWhatIsNone) {
  const auto whole = datagram(" k=v");
  for (size_t length = 0; length < whole.size(); ++length) {
    EXPECT_TRUE(isError(DashboardEvent::decode(std::span(whole).first(length)), EBADMSG)) << length;
  }
  auto longer = whole;
  longer.push_back('x');
  EXPECT_TRUE(isError(DashboardEvent::decode(longer), EBADMSG, "68 bytes and has 69"));
  auto other = whole;
  other[2] = 2;
  EXPECT_TRUE(isError(DashboardEvent::decode(other), EBADMSG, "byte 2 is 2"));
}

TEST(DashboardEventTest, showsNoControlCharacters) {
  auto bytes = datagram(" k=\x1b[2J\r\x07\x7f");
  bytes[20] = '\x1b';
  const auto event = DashboardEvent::decode(bytes);
  ASSERT_TRUE(isOk(event));
  EXPECT_EQ(event->line(), "12.344 ?ev client type 6 session 4711 event 258 method 7 status 2 k=?[2J???");
}

TEST(DashboardEventTest, showsNoControlsOfTwoBytesEither) {
  const auto event =
      DashboardEvent::decode(datagram(" k=\xC2\x9B"
                                      "2J\xC2\xA0\xC3\x9B"));
  ASSERT_TRUE(isOk(event));
  EXPECT_TRUE(event->line().ends_with(" k=?2J\xC2\xA0\xC3\x9B")) << event->line();
}

TEST(DashboardEventTest, refusesMoreThanADatagramEverHas) {
  EXPECT_TRUE(isOk(DashboardEvent::decode(datagram(std::string(1023, 'x')))));
  EXPECT_TRUE(isError(DashboardEvent::decode(datagram(std::string(1024, 'x'))), EBADMSG, "1088 bytes are too many"));
}

TEST(DashboardEventTest, readsFieldsBack) {
  EXPECT_EQ(dashboardFields(""), Dictionary());
  EXPECT_EQ(dashboardFields(" a=1"), (Dictionary{{Key("a"), "1"}}));
  EXPECT_EQ(dashboardFields(" a=x y z b=2"), (Dictionary{{Key("a"), "x y z"}, {Key("b"), "2"}}));
  EXPECT_EQ(dashboardFields(R"( a=\\ b=\= c=\\\=d)"),
            (Dictionary{{Key("a"), "\\"}, {Key("b"), "="}, {Key("c"), "\\=d"}}));
  EXPECT_EQ(dashboardFields(" a=1 a=2"), (Dictionary{{Key("a"), "2"}}));
  EXPECT_EQ(dashboardFields("==="), (Dictionary{{Key(""), ""}}));
  EXPECT_EQ(dashboardFields(" a=b=c"), (Dictionary{{Key("a"), ""}, {Key("b"), "c"}}));
}

TEST(DashboardEventTest, bearsTextsThatNoSenderMakes) {
  EXPECT_EQ(dashboardFields("no fields"), Dictionary());
  EXPECT_EQ(dashboardFields("a=b=c"), (Dictionary{{Key("a"), ""}, {Key("b"), "c"}}));
  EXPECT_EQ(dashboardFields("==="), (Dictionary{{Key(""), ""}}));
  EXPECT_EQ(dashboardFields(" a=\\"), (Dictionary{{Key("a"), "\\"}}));
  EXPECT_EQ(dashboardFields(" = "), (Dictionary{{Key(""), " "}}));
}

}  // namespace
}  // namespace telvane::testing
