#include "tests/endtoend/HierarchyFixture.h"

#include <signal.h>

#include <filesystem>
#include <numeric>
#include <sstream>

#include "interfaces/AgentKeys.h"
#include "interfaces/SessionKeys.h"
#include "platform/JSON.h"

namespace telvane::testing {

HierarchyFixture::HierarchyFixture() {
  instance().grant("telvanectl");
  instance().givenConsent(true);
  const Dictionary open = section("splunk", Array{Value(clientEntry())});
  givenSection(open);
  givenSection(open, kOtherBagName);
}

Dictionary HierarchyFixture::infoWithToken(Value token, int clientType) {
  Dictionary info = sessionInfo(true, clientType);
  info.set(kTelvaneSessionInfoHierarchyToken, std::move(token));
  return info;
}

Dictionary HierarchyFixture::infoIn(const char* token, int64_t level, int clientType) {
  return infoWithToken(Dictionary{{kTelvaneHierarchyTokenTokenID, token}, {kTelvaneHierarchyTokenLevel, level}},
                       clientType);
}

ChildProcess& HierarchyFixture::startUntilWaiting(const ClientScript& script, const std::string& name) {
  _clients[name] = start(script, name);
  EXPECT_TRUE(says(name, "waiting")) << output(name) << instance().read(name + ".err") << instance().daemonLog();
  return client(name);
}

void HierarchyFixture::end(const std::string& name) {
  expectEnd(client(name));
  _clients.erase(name);
}

void HierarchyFixture::endAll() {
  while (!_clients.empty()) end(_clients.begin()->first);
}

void HierarchyFixture::killClient(const std::string& name) {
  client(name).signal(SIGKILL);
  EXPECT_EQ(client(name).wait(), -SIGKILL);
  _clients.erase(name);
}

std::string HierarchyFixture::output(const std::string& name) const { return instance().read(name + ".out"); }

size_t HierarchyFixture::timesSaid(const std::string& name, const std::string& line) const {
  size_t times = 0;
  std::istringstream lines(output(name));
  for (std::string said; std::getline(lines, said);) times += said == line ? 1 : 0;
  return times;
}

bool HierarchyFixture::says(const std::string& name, const std::string& line, size_t times) {
  return eventually([&] { return timesSaid(name, line) >= times; });
}

HierarchyFixture::Numbers HierarchyFixture::heard(const std::string& name, const std::string& from,
                                                  int category) const {
  const std::string start = "aggregated: " + std::to_string(category) + " 1 " + from + " ";
  Numbers numbers;
  std::istringstream lines(output(name));
  for (std::string said; std::getline(lines, said);) {
    // The last line may be under way.
    if (said.starts_with(start) && !lines.eof()) numbers.push_back(std::stoll(said.substr(start.size())));
  }
  return numbers;
}

bool HierarchyFixture::hears(const std::string& name, const std::string& from, size_t count, int category) {
  return eventually([&] { return heard(name, from, category).size() >= count; });
}

std::vector<Dictionary> HierarchyFixture::eventsFrom(const std::string& from, int category) const {
  std::vector<Dictionary> events = arrived(category);
  std::erase_if(events, [&from](const Dictionary& event) { return event["from"].text() != from; });
  return events;
}

HierarchyFixture::Numbers HierarchyFixture::numbersFrom(const std::string& from) const {
  Numbers numbers;
  for (const Dictionary& event : eventsFrom(from)) numbers.push_back(event["n"].integerValue());
  std::sort(numbers.begin(), numbers.end());
  return numbers;
}

HierarchyFixture::Numbers HierarchyFixture::upTo(int count) {
  Numbers numbers(static_cast<size_t>(count));
  std::iota(numbers.begin(), numbers.end(), 0);
  return numbers;
}

void HierarchyFixture::expectEachOnce(const std::string& from, int count) {
  EXPECT_TRUE(eventually([&] { return numbersFrom(from).size() >= static_cast<size_t>(count); }))
      << instance().daemonLog();
  EXPECT_EQ(numbersFrom(from), upTo(count)) << "events from " << from;
}

Dictionary HierarchyFixture::status() {
  std::filesystem::remove(instance().path("status.out"));
  EXPECT_EQ(instance().startProgram("telvanectl", {"status", "--json"}, "status")->wait(), 0)
      << instance().read("status.err");
  const Result<Value> parsed = json::parse(instance().read("status.out"));
  return parsed.has_value() && parsed->isDictionary() ? *parsed->dictionary() : Dictionary();
}

bool HierarchyFixture::comesToHave(int sessions, int hierarchies) {
  return eventually([&] {
    const Dictionary now = status();
    return now[kStatusSessions] == Value(sessions + 1) && now[kStatusHierarchies] == Value(hierarchies);
  });
}

}  // namespace telvane::testing
