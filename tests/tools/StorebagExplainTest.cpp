// What explain says of events, fields, URLs and the bag itself, and how it says it.
#include "tools/StorebagExplain.h"

#include <map>

#include "interfaces/BackendNames.h"
#include "interfaces/StorebagKeys.h"
#include "tests/support/StorebagBuilder.h"
#include "tests/tools/StorebagExplainFixture.h"

namespace telvane::testing {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::Not;
using ::testing::StartsWith;

class StorebagExplainTest : public StorebagExplainFixture {};

TEST_F(StorebagExplainTest, saysWhatBecomesOfEvents) {
  EXPECT_EQ(text(explainBackend(), "events"), "batched, and sent with a flush; real-time ones at once");
  EXPECT_EQ(text(explainBackend(0, {"--batch-events", "off"}), "events"), "sent at once, one by one");
  _client.set(kClientEntryExpedite, 1);
  EXPECT_EQ(text(explainBackend(), "events"), "sent at once, one by one");
  _client.set(kClientEntrySamplingThreshold, 0.0);
  EXPECT_THAT(text(explainBackend(), "events"), HasSubstr("until a promoting message comes"));
  _client.set(kClientEntryOverrideSampling, 0.0);
  EXPECT_EQ(text(explainBackend(), "events"), "dropped");
  _client.set(kClientEntrySamplingThreshold, 1.0);
  _client.set(kClientEntryPostURL, Value());
  EXPECT_THAT(text(explainBackend(), "events"), HasSubstr("no address"));
}

TEST_F(StorebagExplainTest, saysWhichFieldsFiltersTouch) {
  _client.set(kClientEntryFilters, Array{Value(Dictionary{{kFilterKey, "account"}, {kFilterAction, "sha256"}}),
                                         Value(Dictionary{{kFilterKey, "name"}, {kFilterAction, "shred"}})});
  const Dictionary explained = explainBackend();
  EXPECT_EQ(explained["filters"].array()->size(), 2u);
  run({"explain", "@bag", "--country", "US"});
  EXPECT_THAT(output(), HasSubstr("2: account sha256, name none\n"));
}

TEST_F(StorebagExplainTest, aBagsTextCannotSteerATerminalOrLookLikeAnotherLine) {
  _client.set(kClientEntryLocaleWhitelist, Array{"\x1b[2J\nsplunk: enabled"});
  Dictionary section;
  section.set("splunk\nqrs", profile());
  givenBag({{kEnvironmentRelease, section}});
  ASSERT_EQ(run({"explain", "@bag", "--log"}), 0) << errors();
  EXPECT_THAT(output(), HasSubstr("\nsplunk\\nqrs: disabled\n"));
  EXPECT_THAT(output(), Not(HasSubstr("\x1b")));
  EXPECT_THAT(output(), Not(HasSubstr("\nsplunk: enabled")));
}

TEST_F(StorebagExplainTest, showsCharactersThatATerminalActsOnInsteadOfSendingThem) {
  _client.set(kClientEntryLocaleWhitelist, Array{"\u009b31mred\u202evil\ufeff\x7f"});
  explainBackend();
  ASSERT_EQ(run({"explain", "@bag"}), 0) << errors();
  EXPECT_THAT(output(), HasSubstr("\\u009b31mred\\u202evil\\ufeff\\u007f"));
  EXPECT_THAT(output(), Not(HasSubstr("\u009b")));
  EXPECT_THAT(output(), Not(HasSubstr("\u202e")));
}

// Looking each name up among all those before it once took a bag of the largest size an hour.
TEST_F(StorebagExplainTest, aBagOfCountlessMacrosIsExplainedInTheTimeOfAFew) {
  constexpr int kMacros = 100000;
  Dictionary macros;
  Array names;
  for (int n = 0; n < kMacros; ++n) {
    macros.set(fmt::format("==USED{}", n), "US");
    names.append(fmt::format("==USED{}", n));
    names.append(fmt::format("==UNKNOWN{}", n));
  }
  _client.set(kClientEntryLocaleWhitelist, names);
  Dictionary withMacros = bag();
  withMacros.set(kStorebagSharedValues, macros);
  givenBag(withMacros);
  ASSERT_EQ(run({"explain", "@bag"}), 0) << errors();
  EXPECT_THAT(output(), HasSubstr("==USED99 = [US]\n"));
  EXPECT_THAT(output(), HasSubstr("and 99900 more\n"));
  EXPECT_LT(output().size(), 100000u);
  EXPECT_THAT(output(), Not(HasSubstr("==UNKNOWN99999")));
  ASSERT_EQ(run({"explain", "@bag", "--json"}), 0) << errors();
  EXPECT_THAT(output(), HasSubstr("==UNKNOWN99999\""));
}

TEST_F(StorebagExplainTest, namesTheAddressThatPostsReallyGoTo) {
  struct Case {
    const char* url;
    const char* events;
  };
  constexpr Case kCustomer[] = {
      {"https://c.example/e", "sent at once, one by one"},
      {"http://c.example/e", "sent at once, one by one, to https://c.example/e"},
      {"ftp://x/", "sent at once, one by one, to https://x/"},
      {"", "lost: they would be posted to https://, which has no host"},
      {"c.example/e", "lost: they would be posted to https://, which has no host"},
      {"https://", "lost: they would be posted to https://, which has no host"},
  };
  for (const Case& one : kCustomer) {
    _client.set(kClientEntryPostURL, one.url);
    EXPECT_EQ(text(explainBackend(0, {"--batch-events", "off"}), "events"), one.events) << one.url;
  }
  _client.set(kClientEntryPostURL, "http://c.example/e");
  EXPECT_EQ(text(explainBackend(), "postAddress"), "https://c.example/e");
  _client.set(kClientEntryRealtimePostURL, "c.example/realtime");
  EXPECT_EQ(text(explainBackend(), "events"),
            "batched, and sent with a flush, to https://c.example/e; real-time ones are lost: they would be posted to "
            "https://, which has no host");
  _client.set(kClientEntryRealtimePostURL, Value());
  givenBag(bag());
  ASSERT_EQ(run({"explain", "@bag", "--internal", "--environment", "release", "--client-name", "player",
                 "--service-name", "StreamMediaPlayer", "--product-family", "TelvaneBox"}),
            0);
  EXPECT_THAT(output(), HasSubstr("events   sent at once, one by one\n")) << "an internal build takes http as it is";
}

TEST_F(StorebagExplainTest, saysTheShareOfDevicesAndThatTheDrawIsAssumed) {
  _client.set(kClientEntrySamplingThreshold, 0.01);
  _client.set(kClientEntryEventThreshold, -1);
  givenBag(bag());
  ASSERT_EQ(run({"explain", "@bag"}), 0);
  EXPECT_THAT(output(), HasSubstr("factor 0 is below 0.01 (1 % of devices)\n"));
  EXPECT_THAT(output(), HasSubstr("note         the sampling factor is assumed;"));
  EXPECT_THAT(output(), HasSubstr("-1, so every event posts what waits\n"));
  ASSERT_EQ(run({"explain", "@bag", "--sampling-factor", "0"}), 0);
  EXPECT_THAT(output(), Not(HasSubstr("note ")));
  _client.set(kClientEntrySamplingThreshold, 1.0);
  givenBag(bag());
  ASSERT_EQ(run({"explain", "@bag"}), 0);
  EXPECT_THAT(output(), Not(HasSubstr("note ")));
}

TEST_F(StorebagExplainTest, hintsAtTheClientTypeThatTheFileIsNamedAfter) {
  givenBag(bag());
  const std::string content = _scratch.read("bag");
  _scratch.write("conferencing.plist", content);
  ASSERT_EQ(run({"explain", "@conferencing.plist", "--client-type", "6"}), 0);
  EXPECT_THAT(output(), HasSubstr("note         the file is named as the bag of client type 7; see --client-type\n"));
  ASSERT_EQ(run({"explain", "@conferencing.plist", "--client-type", "11"}), 0);
  EXPECT_THAT(output(), Not(HasSubstr("the file is named")));
}

TEST_F(StorebagExplainTest, readsTheReleaseTimeoutAsTheSessionDoes) {
  const auto connection = [this](Value timeout) {
    Dictionary timed = bag();
    timed.set(kStorebagReleaseTimeout, std::move(timeout));
    givenBag(timed);
    EXPECT_EQ(run({"explain", "@bag"}), 0);
    const size_t at = output().find("connection");
    return at == std::string::npos ? "" : output().substr(at, output().find('\n', at) - at);
  };
  EXPECT_EQ(connection(60), "connection   kept 60 s when nobody reports");
  EXPECT_EQ(connection(60.9), "connection   kept 60 s when nobody reports");
  EXPECT_EQ(connection("60 seconds"), "connection   kept 60 s when nobody reports (the bag says 60 seconds)");
  EXPECT_EQ(connection("abc"), "connection   kept until the daemon ends (the bag says abc)");
  EXPECT_EQ(connection(Value()), "");
}

TEST_F(StorebagExplainTest, cutsLongListsInTheTextAndKeepsThemInJSON) {
  Array countries{"US"};
  for (int n = 0; n < 1000; ++n) countries.append("\u00c4\u00d6");
  _client.set(kClientEntryLocaleWhitelist, countries);
  const Dictionary explained = explainBackend(0, {"--country", "FR"});
  EXPECT_EQ((*explained["because"].dictionary())["against"].array()->size(), 1001u);
  ASSERT_EQ(run({"explain", "@bag", "--country", "FR"}), 0);
  EXPECT_THAT(output(), HasSubstr("...\n"));
  EXPECT_LT(output().size(), 8000u);
}

TEST_F(StorebagExplainTest, saysWhichEnvironmentsThereAreWhenTheOneAskedForIsMissing) {
  const Value section = bag()[kEnvironmentRelease];
  givenBag({{kStorebagVersion, "7"}, {kEnvironmentRelease, section}, {kEnvironmentInternal, section}});
  const Dictionary missing = explain(0, {"--environment", "development"});
  EXPECT_FALSE(missing.contains("section"));
  EXPECT_THAT(texts(missing["sections"]), ElementsAre("corvex_internal", "release"));
  EXPECT_TRUE(missing["backends"].array()->empty());
  ASSERT_EQ(run({"explain", "@bag", "--environment", "development"}), 0);
  EXPECT_THAT(output(), HasSubstr("development, which the bag has no section for (it has: corvex_internal, release)"));
  EXPECT_EQ(text(explain(0, {"--environment", "seed"}), "section"), "release");
  ASSERT_EQ(run({"explain", "@bag", "--environment", "seed"}), 0);
  EXPECT_THAT(output(), HasSubstr("release is taken instead"));
}

TEST_F(StorebagExplainTest, takesTheEnvironmentThatTheBuildOrTheSettingsChoose) {
  const Value section = bag()[kEnvironmentRelease];
  givenBag({{kEnvironmentRelease, section}, {kEnvironmentInternal, section}, {kEnvironmentDevelopment, section}});
  const auto sectionWith = [this](const Arguments& options) {
    Arguments arguments{"explain", "@bag", "--json"};
    arguments.insert(arguments.end(), options.begin(), options.end());
    EXPECT_EQ(run(arguments), 0) << errors();
    return text(*json::parse(output()).value().dictionary(), "section");
  };
  _scratch.write("settings", R"({"environmentType": 1})");
  EXPECT_EQ(sectionWith({}), "release");
  EXPECT_EQ(sectionWith({"--internal"}), "corvex_internal");
  EXPECT_EQ(sectionWith({"--defaults", "@settings"}), "development");
  EXPECT_EQ(sectionWith({"--defaults", "@settings", "--environment", "release"}), "release");
}

TEST_F(StorebagExplainTest, expandsMacrosAndNamesThoseThatAreUnusedOrUndefined) {
  _client.set(kClientEntryLocaleWhitelist, "==COUNTRIES");
  _client.set(kClientEntryDeviceBlacklist, "==NOWHERE");
  Dictionary withMacros = bag();
  Dictionary macros;
  macros.set("==COUNTRIES", "US,DE");
  macros.set("==SPARE", 1);
  withMacros.set(kStorebagSharedValues, macros);
  givenBag(withMacros);
  const Dictionary explained = explain();
  EXPECT_EQ(text(only(explained), "state"), "enabled");
  EXPECT_THAT(texts(explained["usedMacros"]), ElementsAre("==COUNTRIES"));
  EXPECT_THAT(texts(explained["undefinedMacros"]), ElementsAre("==NOWHERE"));
  run({"explain", "@bag"});
  EXPECT_THAT(output(), HasSubstr("==COUNTRIES = [US, DE]\n"));
  EXPECT_THAT(output(), HasSubstr("==SPARE = 1 (not used here)\n"));
  EXPECT_THAT(output(), HasSubstr("==NOWHERE is not defined and stays as it is\n"));
}

TEST_F(StorebagExplainTest, saysOfNamesThatMakeNoBackendWhy) {
  Dictionary section;
  section.set(kTelvaneBackendVDR.view().data(), Dictionary{{kProfileActive, true}});
  section.set("nonsense", profile());
  section.set("mysplunk", Dictionary{{kProfileClients, Array()}});
  section.set(kTelvaneBackendQRS.view().data(), profile());
  givenBag({{kEnvironmentRelease, section}, {kStorebagReleaseTimeout, 60}});
  const Dictionary explained = explain();
  const Array& backends = *explained["backends"].array();
  ASSERT_EQ(backends.size(), 4u) << "release_timeout names no backend";
  const auto reason = [&backends](size_t index) {
    const Dictionary& backend = *backends[index].dictionary();
    return std::string((*backend["because"].dictionary())["text"].text());
  };
  EXPECT_EQ(reason(0), "sessions of the client type 6 get none, only those of 7, 11 and 13");
  EXPECT_EQ(reason(1), "no kind of backend has this name");
  EXPECT_EQ(reason(2), "its profile has no list \"clients\" with an entry");
  EXPECT_EQ(text(*backends[3].dictionary(), "state"), "enabled");
  run({"explain", "@bag", "--product-family", ""});
  EXPECT_THAT(output(), HasSubstr("qrs: not made\n  because  a device without product family gets none\n"));
}

// Kinds that ask no gates; each is explained as the daemon would make it, but nothing is opened, sent or loaded.
TEST_F(StorebagExplainTest, tellsWhatBecomesOfTheEventsOfBackendsWithoutGates) {
  Dictionary section;
  section.set("dashboard", Dictionary{{kProfileIP, "192.0.2.1"}, {kProfilePort, 9000}, {kProfileReliable, 500}});
  section.set("upload_server", Dictionary{{kProfilePostURL, "https://a.example/upload"}});
  section.set("power", Dictionary());
  section.set("vdr", Dictionary{{kProfileActive, true}});
  givenBag({{kEnvironmentRelease, section}});
  const Dictionary explained = explain(0, {"--client-type", "7", "--consent", "off"});
  std::map<std::string, std::string> events;
  for (const Value& backend : *explained["backends"].array()) {
    const Dictionary& fields = *backend.dictionary();
    EXPECT_EQ(text(fields, "state"), "enabled") << text(fields, "name");
    EXPECT_EQ(text(*fields["because"].dictionary(), "text"),
              "this kind asks for nothing: it is enabled for every session, also without consent");
    events[text(fields, "name")] = text(fields, "events");
  }
  EXPECT_EQ(events["dashboard"],
            "sent at once, one by one, as datagrams in clear to 192.0.2.1:9000, again until the dashboard acknowledges "
            "them");
  EXPECT_EQ(events["upload_server"],
            "not taken; files that the client hands over are posted to https://a.example/upload");
  EXPECT_EQ(events["power"], "lost: what sessions send does not reach the power log");
  EXPECT_THAT(events["vdr"], StartsWith("handed to the device's wireless-diagnostics adaptor"));
  run({"explain", "@bag", "--client-type", "7", "--log"});
  EXPECT_THAT(output(), HasSubstr("vdr: enabled\n  because  this kind asks for nothing"));
  EXPECT_THAT(output(),
              HasSubstr("  log      VDRBackend(initWithName): Loading VDR adaptor class for client type 7\n"));
}

TEST_F(StorebagExplainTest, saysWhyABackendWithoutGatesIsNotMade) {
  const auto reason = [this](const char* name, Value profile, const Arguments& options = {}) {
    Dictionary section;
    section.set(name, std::move(profile));
    givenBag({{kEnvironmentRelease, section}});
    const Dictionary backend = only(explain(0, options));
    EXPECT_EQ(backend["isMade"], Value(false)) << name;
    EXPECT_FALSE(backend.contains("state")) << name;
    return text(*backend["because"].dictionary(), "text");
  };
  EXPECT_EQ(reason("dashboard", 5), "its profile is no dictionary");
  EXPECT_EQ(reason("dashboard", Dictionary{{kProfilePort, 1}}), "its profile has no text \"ip\"");
  EXPECT_EQ(reason("dashboard", Dictionary{{kProfileIP, "192.0.2.1"}}), "its profile has no \"port\"");
  EXPECT_EQ(reason("dashboard", Dictionary{{kProfileIP, "host"}, {kProfilePort, 1}}), "host is no IPv4 address");
  EXPECT_EQ(reason("upload_server", Dictionary()), "its profile has no text \"post_url\"");
  EXPECT_EQ(reason("vdr", Dictionary(), {"--client-type", "7", "--hardware", "Desktop"}),
            "a desktop computer has no wireless diagnostics");
}

TEST_F(StorebagExplainTest, saysWhatKeepsFilesFromBeingPosted) {
  const auto events = [this](const char* url, const Arguments& options = {}) {
    Dictionary section;
    section.set("upload_server", Dictionary{{kProfilePostURL, url}});
    givenBag({{kEnvironmentRelease, section}});
    return text(only(explain(0, options)), "events");
  };
  EXPECT_THAT(events("a.example/upload"), HasSubstr("which does not begin with https://"));
  EXPECT_THAT(events("ftp://a.example/"), HasSubstr("which is neither https nor http"));
  EXPECT_THAT(events("http://a.example/"), HasSubstr("are posted to http://a.example/"));
  EXPECT_THAT(events("https://a.example/", {"--client-name", "", "--service-name", ""}),
              HasSubstr("cannot post files either"));
}

TEST_F(StorebagExplainTest, readsPropertyListsJSONAndEnvelopes) {
  const auto bagLine = [this](std::string_view bytes) {
    _scratch.write("bag", bytes);
    EXPECT_EQ(run({"explain", "@bag"}), 0) << errors();
    EXPECT_THAT(output(), HasSubstr("\nsplunk: enabled\n"));
    return output().substr(0, output().find('\n'));
  };
  EXPECT_THAT(bagLine(propertylist::serialize(bag(), propertylist::Format::Binary).value().view()),
              HasSubstr("version 7, not signed"));
  EXPECT_THAT(bagLine(json::serialize(bag()).value()), HasSubstr("version 7, not signed"));
  EXPECT_THAT(bagLine(StorebagBuilder::envelopeOfAStranger(bag())),
              HasSubstr("version 7, in an envelope; its signature was not checked"));
}

TEST_F(StorebagExplainTest, namesWhatItAssumed) {
  givenBag(bag());
  ASSERT_EQ(run({"explain", "@bag", "--country", "DE", "--sampling-factor", "0.25"}), 0);
  EXPECT_THAT(output(), HasSubstr("\nassumed      --client-type 5, --client-name example, --service-name ''"));
  EXPECT_THAT(output(), HasSubstr("--consent on"));
  EXPECT_THAT(output(), Not(HasSubstr("--country DE")));
  EXPECT_THAT(output(), Not(HasSubstr("--sampling-factor 0.25")));
  EXPECT_THAT(output(), HasSubstr("country DE"));
  EXPECT_THAT(output(), HasSubstr("sampling factor 0.25"));
  ASSERT_EQ(run({"explain", "@bag", "--service-name", "mail"}), 0);
  EXPECT_THAT(output(), HasSubstr("client none, service mail"));
}

TEST_F(StorebagExplainTest, aSamplingFactorIsOneThatADeviceDraws) {
  givenBag(bag());
  const auto factorOf = [this](const std::string& asked) {
    EXPECT_EQ(run({"explain", "@bag", "--json", "--sampling-factor", asked}), 0) << errors();
    return (*json::parse(output()).value().dictionary()->operator[]("case").dictionary())["samplingFactor"].realValue();
  };
  EXPECT_EQ(factorOf("1"), 0.9999);
  EXPECT_EQ(factorOf("0.29"), 0.29);
  EXPECT_EQ(factorOf("0.12345"), 0.1234);
  EXPECT_EQ(factorOf("0"), 0);
}

TEST_F(StorebagExplainTest, showsTheDaemonsLogLinesWhenAsked) {
  givenBag(bag());
  run({"explain", "@bag"});
  EXPECT_THAT(output(), Not(HasSubstr("  log ")));
  run({"explain", "@bag", "--log", "--country", "FR"});
  EXPECT_THAT(output(), HasSubstr("  log      userDefaultsEnvironment: Environment type 4\n"));
  EXPECT_THAT(output(),
              HasSubstr("  log      HTTPSPostBackend(updateBackendState): (FR) isn't in country code list (\\n"));
}

TEST_F(StorebagExplainTest, printsTheWholeStoryStepByStep) {
  Dictionary other = _client;
  other.set(kClientEntryClient, "other");
  _clients = Array{other, _client};
  givenBag(bag());
  ASSERT_EQ(run({"explain", "@bag", "--client-name", "player", "--country", "FR"}), 0);
  EXPECT_THAT(output().substr(output().find("\nsplunk")),
              "\nsplunk: disabled\n"
              "  because  country: FR is not in [US, DE]\n"
              "  events   dropped\n"
              "  pass     client list                     2 in the list\n"
              "  default  clients[1] expedite             the first entry with the session's names has none, so events "
              "are sent one by one\n"
              "  set      user info required              yes, the entry that is for the session decides\n"
              "  pass     user info                       the session has it\n"
              "  skip     clients[0] client name          player is none of other\n"
              "  pass     clients[1] matching entry       this entry decides alone\n"
              "  pass     clients[1] consent              the user consents\n"
              "  fail     clients[1] country              FR is not in [US, DE]\n");
}

TEST_F(StorebagExplainTest, failsWithOneLineWhenThereIsNothingToExplain) {
  const auto expectFailure = [this](const Arguments& arguments, const std::string& part) {
    EXPECT_EQ(run(arguments), 1);
    EXPECT_THAT(errors(), StartsWith("telvane-storebag: "));
    EXPECT_THAT(errors(), HasSubstr(part));
    EXPECT_EQ(errors().find('\n'), errors().size() - 1) << errors();
    EXPECT_EQ(output(), "");
  };
  expectFailure({"explain", "@nothing"}, "nothing");
  _scratch.write("bag", "garbage");
  expectFailure({"explain", "@bag"}, "cannot be read");
  _scratch.write("bag", "[1]");
  expectFailure({"explain", "@bag"}, "no dictionary");
  _scratch.write("bag", "<plist><dict><key>bag</key><string>AA==</string></dict></plist>");
  expectFailure({"explain", "@bag"}, "signature");
  givenBag(bag());
  _scratch.write("settings", "garbage");
  expectFailure({"explain", "@bag", "--defaults", "@settings"}, "holds no settings");
}

TEST_F(StorebagExplainTest, wrongUsageIsTwo) {
  givenBag(bag());
  const std::vector<Arguments> wrong = {{"explain"},
                                        {"explain", "@bag", "@bag"},
                                        {"explain", "@bag", "--nonsense"},
                                        {"explain", "@bag", "--sampling-factor", "1.1"},
                                        {"explain", "@bag", "--sampling-factor", "-0.1"},
                                        {"explain", "@bag", "--sampling-factor", "nan"},
                                        {"explain", "@bag", "--sampling-factor", "half"},
                                        {"explain", "@bag", "--consent", "maybe"},
                                        {"explain", "@bag", "--client-type", "4"},
                                        {"explain", "@bag", "--client-type", "31"},
                                        {"explain", "@bag", "--environment", "prod"},
                                        {"explain", "@bag", "--framework-version", "new"}};
  for (const Arguments& arguments : wrong) {
    EXPECT_EQ(run(arguments), 2) << ::testing::PrintToString(arguments);
    EXPECT_THAT(errors(), HasSubstr("--help"));
    EXPECT_EQ(output(), "");
  }
}

TEST_F(StorebagExplainTest, hasHelpThatNamesWhatIsAssumed) {
  EXPECT_EQ(run({"explain", "--help"}), 0);
  for (const char* option : {"--client-type", "--client-name", "--service-name", "--country", "--product-family",
                             "--hardware", "--framework-version", "--consent", "--sampling-factor", "--environment"}) {
    EXPECT_THAT(output(), HasSubstr(option));
  }
  EXPECT_THAT(output(), HasSubstr("=US"));
  EXPECT_THAT(output(), HasSubstr("signature is not checked"));
}

}  // namespace
}  // namespace telvane::testing
