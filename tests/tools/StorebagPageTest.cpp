// docs/storebag.md, and the examples that go with it, against the code.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <map>
#include <regex>
#include <set>
#include <sstream>

#include "interfaces/BackendKind.h"
#include "interfaces/ClientTypes.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"
#include "platform/system/PosixFileSystem.h"
#include "storebag/BackendCreation.h"
#include "tests/backends/BackendFixture.h"
#include "tests/support/ScratchFolder.h"
#include "tools/StorebagKeyTable.h"
#include "tools/StorebagLint.h"
#include "tools/StorebagTool.h"

namespace telvane::testing {
namespace {

using ::testing::ElementsAreArray;
using ::testing::HasSubstr;

std::string fileOfTheTree(const std::string& path) {
  FILE* file = fopen((std::string(TELVANE_SOURCE_DIR "/") + path).c_str(), "rb");
  EXPECT_NE(file, nullptr) << path;
  if (file == nullptr) return {};
  std::string content(1 << 20, '\0');
  content.resize(fread(content.data(), 1, content.size(), file));
  fclose(file);
  return content;
}

const std::string& page() {
  static const std::string text = fileOfTheTree("docs/storebag.md");
  return text;
}

std::vector<std::string> linesOf(const std::string& text) {
  std::vector<std::string> lines;
  for (size_t begin = 0; begin < text.size();) {
    const size_t end = std::min(text.find('\n', begin), text.size());
    lines.push_back(text.substr(begin, end - begin));
    begin = end + 1;
  }
  return lines;
}

// The rows of the tables of the page that begin with a name in backticks, by the heading above them.
std::map<std::string, std::vector<std::string>> rowsByHeading() {
  std::map<std::string, std::vector<std::string>> rows;
  std::string heading;
  for (const std::string& line : linesOf(page())) {
    if (line.starts_with("#")) heading = line.substr(line.find(' ') + 1);
    if (line.starts_with("| `")) rows[heading].push_back(line);
  }
  return rows;
}

std::string headingOf(StorebagLevel level) { return "Keys of " + std::string(storebagLevelName(level)); }

std::string rowOf(const StorebagKey& key) {
  const bool isRequired = key.presence == StorebagPresence::Required;
  return fmt::format("| `{}` | {} | {}{} | {} | {} |", key.key.view(), storebagShapeName(key.shape),
                     isRequired ? "**required**; without it: " : "", key.absent, key.meaning, key.effect);
}

TEST(StorebagPageTest, tellsEveryKeyAsTheTableOfKeysHasIt) {
  auto rows = rowsByHeading();
  for (const StorebagLevel level : kStorebagLevels) {
    std::vector<std::string> expected;
    for (const StorebagKey& key : storebagKeys(level)) expected.push_back(rowOf(key));
    EXPECT_THAT(rows[headingOf(level)], ElementsAreArray(expected)) << headingOf(level);
  }
}

TEST(StorebagPageTest, hasNoTableOfKeysThatTheCodeDoesNotHave) {
  std::set<std::string> known;
  for (const StorebagLevel level : kStorebagLevels) known.insert(headingOf(level));
  for (const auto& [heading, rows] : rowsByHeading()) {
    EXPECT_TRUE(!heading.starts_with("Keys of ") || known.contains(heading)) << heading;
  }
}

std::string exampleBag() {
  constexpr std::string_view kBegin = "```json\n";
  const size_t begin = page().find(kBegin);
  EXPECT_NE(begin, std::string::npos);
  if (begin == std::string::npos) return {};
  const size_t end = page().find("```", begin + kBegin.size());
  return page().substr(begin + kBegin.size(), end - begin - kBegin.size());
}

TEST(StorebagPageTest, itsExampleBagIsWithoutAMistake) {
  const Result<LintReport> report = StorebagLint::lintFile(Data(exampleBag()));
  ASSERT_TRUE(report.has_value()) << report.error().description();
  for (const LintFinding& finding : report->findings()) ADD_FAILURE() << finding.path << ": " << finding.text;
}

// The cells of a row of a table, without the blanks around them.
std::vector<std::string> cellsOf(const std::string& row) {
  std::vector<std::string> cells;
  for (size_t begin = 1, end = row.find('|', 1); end != std::string::npos; end = row.find('|', begin)) {
    std::string cell = row.substr(begin, end - begin);
    cell.erase(0, std::min(cell.find_first_not_of(' '), cell.size()));
    cell.erase(cell.find_last_not_of(' ') + 1);
    cells.push_back(cell);
    begin = end + 1;
  }
  return cells;
}

// What explain says, which asks the daemon's own code.
std::string explainedState(const std::string& bagFile, const std::vector<std::string>& cells, const char* consent) {
  PosixFileSystem files{Paths{}};
  std::ostringstream output;
  std::ostringstream errors;
  const std::vector<const char*> arguments = {
      "telvane-storebag", "explain",        bagFile.c_str(),  "--client-type",     "22",
      "--client-name",    cells[0].c_str(), "--service-name", cells[1].c_str(),    "--framework-version",
      cells[2].c_str(),   "--country",      cells[3].c_str(), "--sampling-factor", cells[4].c_str(),
      "--consent",        consent};
  StorebagTool(files, output, errors).run(static_cast<int>(arguments.size()), arguments.data());
  EXPECT_EQ(errors.str(), "");
  const std::vector<std::string> lines = linesOf(output.str());
  const auto line =
      std::find_if(lines.begin(), lines.end(), [](const auto& text) { return text.starts_with("splunk: "); });
  return line != lines.end() ? line->substr(line->find(' ') + 1) : output.str();
}

TEST(StorebagPageTest, tellsOfItsExampleWhatTheDaemonDecides) {
  const ScratchFolder scratch;
  const std::string file = scratch.write("health.json", exampleBag());
  const size_t table = page().find("| client | service | framework |");
  ASSERT_NE(table, std::string::npos);
  const std::vector<std::string> lines = linesOf(page().substr(table));
  size_t rows = 0;
  for (size_t i = 2; i < lines.size() && lines[i].starts_with("|"); ++i, ++rows) {
    const std::vector<std::string> cells = cellsOf(lines[i]);
    ASSERT_EQ(cells.size(), 7u) << lines[i];
    EXPECT_EQ(explainedState(file, cells, "on"), cells[5]) << lines[i];
    EXPECT_EQ(explainedState(file, cells, "off"), "disabled") << lines[i];
  }
  EXPECT_EQ(rows, 9u);
}

TEST(StorebagPageTest, tellsWhichBagEachClientTypeReads) {
  std::map<std::string, std::string> types;
  std::vector<std::string> names;
  for (const ClientType& type : allClientTypes()) {
    std::string& numbers = types[std::string(type.storebagName)];
    if (numbers.empty()) names.emplace_back(type.storebagName);
    numbers += (numbers.empty() ? "" : ", ") + std::to_string(type.number);
  }
  std::vector<std::string> expected;
  for (const std::string& name : names) expected.push_back("| `" + name + "` | " + types[name] + " |");
  EXPECT_THAT(rowsByHeading()["Which bag a session reads"], ElementsAreArray(expected));
}

// The sources with literals that go over several lines put together.
std::string sourcesThatLog() {
  std::string text;
  for (const char* file :
       {"backends/TelvaneBackend.cpp", "backends/HTTPSPostBackend.cpp", "backends/HTTPSPostConfiguration.cpp",
        "backends/HTTPSPostRequests.cpp", "backends/DashboardBackend.cpp", "backends/UploadBackend.cpp",
        "backends/VDRBackend.cpp", "storebag/StorebagRetriever.cpp", "storebag/StorebagSection.cpp",
        "storebag/StorebagVerification.cpp", "daemon/TelvanedAgentStorebags.cpp",
        "daemon/session/TelvanedSessionMessages.cpp"}) {
    text += fileOfTheTree(file);
  }
  std::string joined;
  for (size_t at = 0; at < text.size(); ++at) {
    const size_t next = text[at] == '"' ? text.find_first_not_of(" \n", at + 1) : at;
    const bool isSeam = next != std::string::npos && next > at + 1 && text[next] == '"';
    if (isSeam) {
      at = next;
    } else {
      joined += text[at];
    }
  }
  return joined;
}

// The page writes a word in capitals for what varies.
TEST(StorebagPageTest, quotesLogLinesThatTheDaemonWrites) {
  const std::string sources = sourcesThatLog();
  const std::regex varying(
      "\\b(URL|ERROR|ADDRESS|NAME|SECTION|N|900|COUNTRY|LIST|FAMILY|HARDWARE|CLIENT|SERVICE|STATE|DRAW|STATUS)\\b|: ");
  const std::vector<std::string> rows = rowsByHeading()["What the log says"];
  for (const std::string& row : rows) {
    const std::string line = row.substr(3, row.find("` |") - 3);
    for (auto piece = std::sregex_token_iterator(line.begin(), line.end(), varying, -1);
         piece != std::sregex_token_iterator(); ++piece) {
      EXPECT_THAT(sources, HasSubstr(piece->str())) << line;
    }
  }
  EXPECT_EQ(rows.size(), 26u);
}

class ExampleBagTest : public ::testing::TestWithParam<const char*> {};

// As they lie in the tree they still have the mark for the collector, and they are for customers' devices only. The one
// with a dashboard says itself what lint warns of.
TEST_P(ExampleBagTest, isWithoutAMistake) {
  std::string bag = fileOfTheTree(std::string("examples/storebags/") + GetParam());
  const Result<LintReport> unfinished = StorebagLint::lintFile(Data(bag));
  ASSERT_TRUE(unfinished.has_value()) << unfinished.error().description();
  EXPECT_EQ(unfinished->count(LintFinding::Severity::Error), 0u);
  for (size_t at = bag.find("@COLLECTOR@"); at != std::string::npos; at = bag.find("@COLLECTOR@")) {
    bag.replace(at, 11, "127.0.0.1:8443");
  }
  const Result<LintReport> finished = StorebagLint::lintFile(Data(bag));
  ASSERT_TRUE(finished.has_value());
  for (const LintFinding& finding : finished->findings()) {
    const bool isLeftOut = finding.text.find("add it if you have such devices") != std::string::npos;
    const bool isOfDashboard = finding.path == "release/dashboard";
    EXPECT_TRUE(isLeftOut || isOfDashboard) << finding.path << ": " << finding.text;
  }
}

INSTANTIATE_TEST_SUITE_P(Examples, ExampleBagTest,
                         ::testing::Values("conferencing.plist", "enabled.plist", "sampled-out.plist", "disabled.plist",
                                           "destinations.plist"));

// What the page and lint say about backends, against the factory.
class StorebagPageBackendTest : public BackendFixture {
 protected:
  ~StorebagPageBackendTest() override {
    for (const auto& backend : _made) backend->cleanup();
    _world.runUntilIdle();
  }
  // What the kind of this name needs to be made.
  Dictionary profileFor(const std::string& name) const {
    if (name == "dashboard") return {{kProfileIP, "192.0.2.1"}, {kProfilePort, 9000}};
    if (name == "upload_server") return {{kProfilePostURL, "https://collector.example/upload"}};
    return profile();
  }
  // Null when the factory makes none.
  std::shared_ptr<TelvaneBackend> make(const std::string& name) {
    Dictionary section;
    section.set(name, profileFor(name));
    const auto table =
        createBackends(context(), section, Dictionary{{kTelvaneSessionInfoClientType, 7}}, _userInfo, "");
    if (!table.has_value() || table->size() != 1) return nullptr;
    _made.push_back(table->front().second);
    return _made.back();
  }

 private:
  std::vector<std::shared_ptr<TelvaneBackend>> _made;
};

TEST_F(StorebagPageBackendTest, knowsTheBackendsThatTheFactoryMakes) {
  log().allowErrors();
  for (const char* name :
       {"splunk", "my-splunk-2", "gonzo", "qrs", "dashboard", "upload_server", "power", "vdr", "nonsense"}) {
    EXPECT_EQ(make(name) != nullptr, backendKindForName(name) != BackendKind::Unknown) << name;
  }
  Dictionary section;
  section.set("nonsense", profile());
  const LintReport report = StorebagLint::lintBag({{kStorebagVersion, "1"}, {kEnvironmentRelease, section}});
  const auto& findings = report.findings();
  EXPECT_TRUE(std::any_of(findings.begin(), findings.end(), [](const LintFinding& finding) {
    return finding.path == "release/nonsense" && finding.severity == LintFinding::Severity::Error;
  }));
}

// Each kind, and whether it asks the gates: without consent, only who asks nothing is enabled.
TEST_F(StorebagPageBackendTest, tellsWhichBackendsAskForConsent) {
  process().consent().set(false);
  const std::vector<std::string> rows = rowsByHeading()["Backends"];
  ASSERT_EQ(rows.size(), 7u);
  for (const std::string& row : rows) {
    const auto backend = make(row.substr(3, row.find('`', 3) - 3));
    ASSERT_NE(backend, nullptr) << row;
    const bool isEnabled = backend->updateState() == TelvaneBackendStateEnabled;
    EXPECT_EQ(row.ends_with("| nothing |"), isEnabled) << row;
    EXPECT_EQ(row.ends_with("| the gates |"), !isEnabled) << row;
  }
}

}  // namespace
}  // namespace telvane::testing
