// What lint says of backends that are no HTTPS ones.
#include "tests/tools/LintBags.h"

namespace telvane::testing {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr char kNoConsent[] = "gets every event, unfiltered and in clear, also of users who do not agree";

std::vector<std::string> lintBackend(const char* name, Value profile, std::string_view bagName = {}) {
  Dictionary section;
  section.set(name, std::move(profile));
  return linesOf(StorebagLint::lintBag(bagWith("release", section), bagName));
}

// A dashboard with one key changed; what is said of it beside the warning that every dashboard gets.
std::vector<std::string> lintDashboard(const char* key, Value value) {
  Dictionary profile{{kProfileIP, "192.0.2.1"}, {kProfilePort, 9000}};
  profile.set(key, std::move(value));
  std::vector<std::string> lines = lintBackend("dashboard", profile);
  EXPECT_FALSE(lines.empty());
  if (lines.empty()) return lines;
  EXPECT_THAT(lines[0], warning("release/dashboard", kNoConsent));
  lines.erase(lines.begin());
  return lines;
}

std::vector<std::string> lintUploadTo(Value url) {
  return lintBackend("upload_server", Dictionary{{kProfilePostURL, std::move(url)}});
}

TEST(OtherBackendsLintTest, warnsOfADashboardWhateverConsentSays) {
  EXPECT_THAT(lintBackend("dashboard", parsed(R"({"ip": "192.0.2.1", "port": 9000, "reliable": 500,
                                                 "post_url": "https://a.example/logdata",
                                                 "display_url": "https://a.example/"})")),
              ElementsAre(warning("release/dashboard", kNoConsent)));
}

TEST(OtherBackendsLintTest, aDashboardNeedsAddressAndPort) {
  EXPECT_THAT(lintBackend("dashboard", Dictionary()),
              ElementsAre(warning("release/dashboard", kNoConsent),
                          error("release/dashboard/ip", "is missing: no backend is made"),
                          error("release/dashboard/port", "is missing: no backend is made")));
  EXPECT_THAT(lintBackend("dashboard", 5), ElementsAre(warning("release/dashboard", kNoConsent),
                                                       error("release/dashboard", "is a number, and no backend")));
}

TEST(OtherBackendsLintTest, theAddressIsADottedIPv4AddressAsDevicesReadIt) {
  for (const char* address : {"192.0.2.1", "0.0.0.0", "255.255.255.255"}) {
    EXPECT_THAT(lintDashboard("ip", address), IsEmpty()) << address;
  }
  for (const char* address :
       {"dashboard.example", "192.0.2", "192.0.2.256", "::1", " 192.0.2.1", "192.0.2.1:9000", ""}) {
    EXPECT_THAT(lintDashboard("ip", address),
                ElementsAre(error("release/dashboard/ip", "is no dotted IPv4 address, and no backend is made; write")))
        << address;
  }
  EXPECT_THAT(lintDashboard("ip", 5),
              ElementsAre(error("release/dashboard/ip", "is a number, and no backend is made")));
}

TEST(OtherBackendsLintTest, thePortHas16Bits) {
  EXPECT_THAT(lintDashboard("port", 1), IsEmpty());
  EXPECT_THAT(lintDashboard("port", 65535), IsEmpty());
  const auto saying = [](const char* text) { return ElementsAre(error("release/dashboard/port", text)); };
  EXPECT_THAT(lintDashboard("port", 70000), saying("more than 16 bits, of which devices take the low ones: 4464"));
  EXPECT_THAT(lintDashboard("port", -1), saying("of which devices take the low ones: 65535"));
  EXPECT_THAT(lintDashboard("port", 0), saying("is the port 0 for devices"));
  EXPECT_THAT(lintDashboard("port", 65536), saying("is the port 0 for devices"));
  EXPECT_THAT(lintDashboard("port", "9000"), ElementsAre(warning("release/dashboard/port", "write a number")));
  EXPECT_THAT(lintDashboard("port", Array{9000}), saying("is an array, and devices read it as 0"));
}

TEST(OtherBackendsLintTest, thePeriodOfAReliableDashboardIsBounded) {
  for (const int period : {10, 500, 60000}) EXPECT_THAT(lintDashboard("reliable", period), IsEmpty()) << period;
  const auto saying = [](const char* text) { return ElementsAre(error("release/dashboard/reliable", text)); };
  EXPECT_THAT(lintDashboard("reliable", 0), saying("is 0, which counts as 500; make it"));
  EXPECT_THAT(lintDashboard("reliable", -7), saying("is -7, which counts as 500"));
  EXPECT_THAT(lintDashboard("reliable", 9), saying("is 9, which counts as 10"));
  EXPECT_THAT(lintDashboard("reliable", 60001), saying("is 60001, which counts as 60000"));
  EXPECT_THAT(lintDashboard("reliable", int64_t{1} << 40), saying("which counts as 60000"));
  EXPECT_THAT(lintDashboard("reliable", true), ElementsAre(warning("release/dashboard/reliable", "read as 1"),
                                                           error("release/dashboard/reliable", "counts as 10")));
}

TEST(OtherBackendsLintTest, filesAndLogDataGoOverPlainHTTPWhereTheBagSaysSo) {
  EXPECT_THAT(lintUploadTo("https://a.example/upload"), IsEmpty());
  EXPECT_THAT(lintUploadTo("http://a.example/upload"),
              ElementsAre(warning("release/upload_server/post_url", "is plain http: devices post unencrypted")));
  EXPECT_THAT(lintUploadTo("ftp://a.example/"), ElementsAre(error("release/upload_server/post_url", "has the scheme")));
  EXPECT_THAT(lintUploadTo(5), ElementsAre(error("release/upload_server/post_url", "is a number")));
  EXPECT_THAT(lintDashboard("post_url", "http://a.example/logdata"),
              ElementsAre(warning("release/dashboard/post_url", "is plain http: devices post unencrypted")));
}

TEST(OtherBackendsLintTest, anUploadURLHasNoQueryOfItsOwn) {
  EXPECT_THAT(lintUploadTo("https://a.example/upload?key=1"),
              ElementsAre(error("release/upload_server/post_url", "has a query or fragment of its own")));
  EXPECT_THAT(lintUploadTo("https://a.example/upload#top"),
              ElementsAre(error("release/upload_server/post_url", "has a query or fragment of its own")));
  EXPECT_THAT(lintDashboard("post_url", "https://a.example/logdata?key=1"), IsEmpty()) << "nothing is added there";
}

TEST(OtherBackendsLintTest, anUploadServerNeedsAURL) {
  EXPECT_THAT(lintBackend("upload_server", Dictionary()),
              ElementsAre(error("release/upload_server/post_url", "is missing: no backend is made")));
  EXPECT_THAT(lintBackend("upload_server", Array()),
              ElementsAre(error("release/upload_server", "is an array, and no backend is made")));
}

TEST(OtherBackendsLintTest, thePowerLogGetsNothing) {
  EXPECT_THAT(lintBackend("power", Dictionary()), ElementsAre(warning("release/power", "gets no event")));
}

TEST(OtherBackendsLintTest, wirelessDiagnosticsAreForTheClientTypesOfOneBag) {
  const Dictionary active{{kProfileActive, true}};
  EXPECT_THAT(lintBackend("vdr", active), IsEmpty()) << "whose bag it is, is not known";
  EXPECT_THAT(lintBackend("vdr", active, "conferencing"), IsEmpty());
  EXPECT_THAT(lintBackend("vdr", active, "my-own"), IsEmpty());
  EXPECT_THAT(lintBackend("vdr", active, "media"),
              ElementsAre(warning("release/vdr",
                                  "is made for the client types 7, 11 and 13 only, and the bag \"media\" is read by "
                                  "6, 14, 15: their sessions log an error")));
  EXPECT_THAT(lintBackend("vdr", 5), ElementsAre(error("release/vdr", "the backend is made all the same")));
}

}  // namespace
}  // namespace telvane::testing
