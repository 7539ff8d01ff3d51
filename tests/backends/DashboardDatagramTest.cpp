// What a dashboard gets and what a client is told: every byte of it worked out by hand.
#include <gmock/gmock.h>

#include "backends/DashboardDatagram.h"
#include "interfaces/SessionKeys.h"
#include "tests/backends/DashboardFixture.h"

namespace telvane::testing {
namespace {

using ::testing::ElementsAreArray;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::StartsWith;

// 12.345678 s after 1970.
constexpr Date kTime{Date::TimePoint(std::chrono::microseconds(12'345'678))};
constexpr uint16_t kEventID = 258;

class DashboardDatagramTest : public DashboardFixture {
 protected:
  std::optional<String> sendAt(Date time, const Dictionary& event, uint16_t eventID = kEventID) {
    auto line = backend().sendMessage(event, time, uint16_t{7}, uint16_t{2}, eventID);
    _world.runUntilIdle();
    return line;
  }
  std::string textOfEvent(Dictionary event) {
    send(std::move(event));
    return lastTextAt(dashboard());
  }
  Bytes lastDatagram() { return dashboard().arrivals().empty() ? Bytes() : dashboard().arrivals().back().bytes; }
};

TEST_F(DashboardDatagramTest, hasEveryByteOfTheFormat) {
  givenReliable();
  make();
  sendAt(kTime, Dictionary{{Key("name"), "a=b"}, {Key("ok"), true}});
  const Bytes expected = {8,    6,    1,    86,    // version 8, type 6, constant, 345678 / 4000
                          0,    0,    0,    12,    // seconds
                          0xFF, 0xFF, 0xED, 0x98,  // not 0x00001267 (4711)
                          0xFF, 0xFC,              // not 3
                          0xFF, 0xB0,              // not 0x004F (64 + 15)
                          0,    7,    0,    2,     // method, response code
                          '0',  '1',  '2',  '3',  '4', '5', '6', '7', '8', '9', 'a', 'b', 'c',  'd', 'e',
                          'f',  '0',  '1',  '2',  '3', '4', '5', '6', '7', '8', '9', 'a', 'b',  'c', 'd',
                          'e',  'f',  '0',  '1',  '2', '3', '4', '5', '6', '7', 1,   2,  // event ID 258
                          0,    1,                                                       // reliable, by a profile
                          ' ',  'o',  'k',  '=',  '1', ' ', 'n', 'a', 'm', 'e', '=', 'a', '\\', '=', 'b'};
  EXPECT_THAT(lastDatagram(), ElementsAreArray(expected));
}

TEST_F(DashboardDatagramTest, isToldToTheClientAsOneLine) {
  make();
  const auto line = sendAt(kTime, Dictionary{{Key("name"), "a=b"}, {Key("ok"), true}});
  EXPECT_EQ(line,
            String("12.344 0123456789abcdef0123456789abcdef01234567 127.0.0.1 MEDIA     3  4711   258     7     2  "
                   "ok=1 name=a\\=b"));
}

TEST_F(DashboardDatagramTest, ofAnEventWithoutFieldsIsTheHeaderAlone) {
  make();
  const auto line = sendAt(kTime, {});
  EXPECT_EQ(lastDatagram().size(), 64u);
  EXPECT_EQ(lastDatagram().at(14), 0xFF);
  EXPECT_EQ(lastDatagram().at(15), 0xBF) << "not 64";
  ASSERT_TRUE(line.has_value());
  EXPECT_THAT(line->str(), EndsWith("     7     2 "));
}

TEST_F(DashboardDatagramTest, flagsTellOfReliabilityAndOfTheProfile) {
  const auto flags = [this] { return lastDatagram().at(62) << 8 | lastDatagram().at(63); };
  make();
  send({});
  EXPECT_EQ(flags(), 0);
  givenReliable();
  make();
  send({});
  EXPECT_EQ(flags(), 1);
  take(DashboardBackend::initWithName(context(), "dashboard", String(kIP), kPort, String("Box")));
  send({});
  EXPECT_EQ(flags(), 3);
  network().faults().bind = EADDRINUSE;
  log().expectError("DashboardBackend(useReliableUDP): can't bind socket, 98");
  take(DashboardBackend::initWithName(context(), "dashboard", String(kIP), kPort, String("Box")));
  send({});
  EXPECT_EQ(flags(), 2) << "reliable mode could not be had";
}

TEST_F(DashboardDatagramTest, numbersOfTheHeaderAreCutToTheirSize) {
  make();
  backend().setSelfVersion("300.1");
  backend().setCompType(0x1FF);
  backend().setSessionID(0xFFFFFFFF);
  backend().setClientVersion(0xFFFF);
  const Date late{Date::TimePoint(std::chrono::seconds(0x1'2345'6789) + std::chrono::microseconds(999'999))};
  const auto line = sendAt(late, {}, 0xFFFF);
  const Bytes datagram = lastDatagram();
  EXPECT_EQ(datagram.at(0), 44) << "300 in 8 bits";
  EXPECT_EQ(datagram.at(1), 0xFF);
  EXPECT_EQ(datagram.at(3), 249);
  EXPECT_THAT(Bytes(datagram.begin() + 4, datagram.begin() + 14),
              ElementsAreArray({0x23, 0x45, 0x67, 0x89, 0, 0, 0, 0, 0, 0}));
  EXPECT_EQ(eventIDOf(datagram), 0xFFFF);
  ASSERT_TRUE(line.has_value());
  EXPECT_THAT(line->str(), StartsWith("591751049.996 0123456789abcdef"));
  EXPECT_THAT(line->str(), HasSubstr(" 127.0.0.1 unknown 65535 4294967295 65535     7     2 "));
}

TEST_F(DashboardDatagramTest, fractionsOfASecondCountIn4Milliseconds) {
  make();
  for (const auto& [microseconds, fraction, text] :
       {std::tuple(0, 0, "0.000 "), {3999, 0, "0.000 "}, {4000, 1, "0.004 "}, {999'999, 249, "0.996 "}}) {
    const auto line = sendAt(Date(Date::TimePoint(std::chrono::microseconds(microseconds))), {});
    EXPECT_EQ(lastDatagram().at(3), fraction) << microseconds;
    EXPECT_THAT(line->str(), StartsWith(text)) << microseconds;
  }
}

TEST_F(DashboardDatagramTest, hasTheFirst40BytesOfTheIdentifierAndZerosBehindAShorterOne) {
  make();
  backend().setUdid("short");
  auto line = sendAt(kTime, {});
  Bytes expected = {'s', 'h', 'o', 'r', 't'};
  expected.resize(40, 0);
  Bytes datagram = lastDatagram();
  EXPECT_THAT(Bytes(datagram.begin() + 20, datagram.begin() + 60), ElementsAreArray(expected));
  EXPECT_THAT(line->str(), HasSubstr("12.344 short 127.0.0.1 MEDIA"));
  backend().setUdid(std::string(kDeviceIdentifier) + "and more");
  line = sendAt(kTime, {});
  datagram = lastDatagram();
  EXPECT_EQ(std::string(datagram.begin() + 20, datagram.begin() + 60), kDeviceIdentifier);
  EXPECT_EQ(eventIDOf(datagram), kEventID);
  EXPECT_THAT(line->str(), HasSubstr(std::string(" ") + kDeviceIdentifier + " 127"));
}

TEST_F(DashboardDatagramTest, givesShorterValuesFirst) {
  make();
  EXPECT_EQ(textOfEvent({{Key("long"), "12345678"}, {Key("two"), 22}, {Key("one"), "x"}, {Key("none"), Array{1}}}),
            " one=x two=22 none=null long=12345678");
}

TEST_F(DashboardDatagramTest, measuresValuesAsTheyAreBeforeTheyAreMadeSafe) {
  make();
  // "==" has 2 characters and becomes 4; an empty text has none and becomes "empty".
  EXPECT_EQ(textOfEvent({{Key("three"), "abc"}, {Key("equals"), "=="}, {Key("nothing"), ""}}),
            " nothing=empty equals=\\=\\= three=abc");
  EXPECT_EQ(textOfEvent({{Key("ascii"), "abc"}, {Key("umlauts"), "ä\xC3\xB6"}}), " umlauts=ä\xC3\xB6 ascii=abc")
      << "in characters, not in bytes";
}

TEST_F(DashboardDatagramTest, writesNullForWhatIsNeitherTextNorNumber) {
  make();
  for (const Value& value :
       {Value(Array()), Value(Dictionary{{Key("a"), 1}}), Value(Date()), Value(Data::copyOf("x"))}) {
    EXPECT_EQ(textOfEvent({{Key("k"), value}}), " k=null");
  }
  EXPECT_EQ(textOfEvent({{Key("k"), "null"}}), " k=null");
}

TEST_F(DashboardDatagramTest, writesNumbersAsTheyAreDescribed) {
  make();
  for (const auto& [value, text] : {std::pair(Value(true), "1"),
                                    {Value(false), "0"},
                                    {Value(-7), "-7"},
                                    {Value(UINT64_MAX), "18446744073709551615"},
                                    {Value(1.5), "1.5"},
                                    {Value(0.1), "0.1"}}) {
    EXPECT_EQ(textOfEvent({{Key("k"), value}}), std::string(" k=") + text);
  }
}

TEST_F(DashboardDatagramTest, makesValuesSafe) {
  make();
  EXPECT_EQ(textOfEvent({{Key("k"), "a\nb"}}), " k=ab");
  EXPECT_EQ(textOfEvent({{Key("k"), "\n\n"}}), " k=empty");
  EXPECT_EQ(textOfEvent({{Key("k"), ""}}), " k=empty");
  EXPECT_EQ(textOfEvent({{Key("k"), R"(a\b=c)"}}), R"( k=a\\b\=c)");
  EXPECT_EQ(textOfEvent({{Key("k"), R"(\=)"}}), R"( k=\\\=)");
}

// Or a client could write lines into a log that look like another's.
TEST_F(DashboardDatagramTest, leavesLineFeedsOutOfKeysToo) {
  make();
  const auto line = send({{Key("a\n(2026-01-01 00:00:00 +0000) [splunk"), 1}});
  EXPECT_EQ(lastTextAt(dashboard()), " a(2026-01-01 00:00:00 +0000) [splunk=1");
  EXPECT_EQ(line->str().find('\n'), std::string::npos);
}

TEST_F(DashboardDatagramTest, cutsTheTextAt1023Bytes) {
  make();
  const auto whole = send({{Key("k"), std::string(1020, 'x')}});  // " k=" and 1020
  EXPECT_EQ(lastDatagram().size(), 64u + 1023u);
  EXPECT_EQ(lastDatagram().at(14) << 8 | lastDatagram().at(15), 0xFFFF - 1087);
  EXPECT_THAT(whole->str(), EndsWith(std::string(1020, 'x')));
  send({{Key("k"), std::string(1021, 'x')}});
  EXPECT_EQ(lastDatagram().size(), 64u + 1023u);
  EXPECT_EQ(lastTextAt(dashboard()), " k=" + std::string(1020, 'x'));
  send({{Key("short"), "1"}, {Key("k"), std::string(100'000, 'x')}, {Key("lost"), std::string(100'001, 'y')}});
  EXPECT_EQ(lastTextAt(dashboard()), " short=1 k=" + std::string(1012, 'x'));
}

TEST_F(DashboardDatagramTest, cutsBetweenCharacters) {
  make();
  EXPECT_EQ(textOfEvent({{Key("k"), std::string(1019, 'x') + "\xC3\xA4"}}), " k=" + std::string(1019, 'x'));
  EXPECT_EQ(textOfEvent({{Key("k"), std::string(1018, 'x') + "\xC3\xA4z"}}),
            " k=" + std::string(1018, 'x') + "\xC3\xA4");
  EXPECT_EQ(textOfEvent({{Key("k"), std::string(1017, 'x') + "\xF0\x9F\x98\x80"}}), " k=" + std::string(1017, 'x'));
  EXPECT_EQ(textOfEvent({{Key("k"), std::string(2000, '\x80')}}).size(), 1023u) << "no UTF-8";
}

TEST_F(DashboardDatagramTest, aLineHasAtMost1151Bytes) {
  Bytes longest(64 + 1200, 'x');
  longest[1] = 6;
  EXPECT_EQ(DashboardBackend::writeLocalLog(longest).size(), 1151u);
}

TEST_F(DashboardDatagramTest, hasTheClientsDataOfAMessageAndNotWhatSessionsShare) {
  make();
  TelvaneBackend& base = backend();
  base.sendMessage(Dictionary{{kTelvaneMessageBlobSharedData, Dictionary{{Key("shared"), 1}}},
                              {kTelvaneMessageBlobClientData, Dictionary{{Key("own"), 2}}}},
                   kTime, 7, 2, 0);
  _world.runUntilIdle();
  EXPECT_EQ(lastTextAt(dashboard()), " own=2");
  base.sendMessage(Dictionary{{Key("own"), 3}}, kTime, 7, 2, 0);
  _world.runUntilIdle();
  EXPECT_EQ(lastTextAt(dashboard()), " own=3") << "a message without a configured session";
}

TEST_F(DashboardDatagramTest, hasNoTextWhereTheClientSentNoPayloadWhateverItsSessionsShare) {
  make();
  TelvaneBackend& base = backend();
  const auto line =
      base.sendMessage(Dictionary{{kTelvaneMessageBlobSharedData, Dictionary{{Key("shared"), 1}}}}, kTime, 7, 2, 0);
  _world.runUntilIdle();
  ASSERT_EQ(dashboard().arrivals().size(), 1u);
  EXPECT_EQ(lastTextAt(dashboard()), "");
  ASSERT_TRUE(line.has_value());
  EXPECT_EQ(line->view().find("SharedData"), std::string_view::npos) << line->view();
}

TEST_F(DashboardDatagramTest, numbersEventsFromOne) {
  make();
  sendMany(3);
  std::vector<uint16_t> numbers;
  for (const auto& arrival : dashboard().arrivals()) numbers.push_back(eventIDOf(arrival.bytes));
  EXPECT_THAT(numbers, ::testing::ElementsAre(1, 2, 3));
}

TEST_F(DashboardDatagramTest, isReadBackAsItWasWritten) {
  Bytes bytes(64);
  const dashboard::Header header{.majorVersion = 1,
                                 .componentType = 2,
                                 .timestamp = Date(Date::TimePoint(std::chrono::milliseconds(3004))),
                                 .sessionID = 5,
                                 .clientVersion = 6,
                                 .method = 7,
                                 .responseCode = 8,
                                 .deviceIdentifier = "nine",
                                 .eventID = 10,
                                 .isReliable = false,
                                 .isWithoutProfile = true};
  dashboard::writeHeader(header, 11, bytes);
  const dashboard::Header read = dashboard::readHeader(bytes);
  EXPECT_EQ(read.timestamp, header.timestamp);
  EXPECT_EQ(read.sessionID, 5u);
  EXPECT_EQ(read.deviceIdentifier, "nine");
  EXPECT_FALSE(read.isReliable);
  EXPECT_TRUE(read.isWithoutProfile);
}

}  // namespace
}  // namespace telvane::testing
