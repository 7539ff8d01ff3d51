#include "tests/daemon/DaemonFixture.h"

#include "interfaces/EventKeys.h"
#include "tests/support/RecordingConnectivity.h"

namespace telvane::testing {

DaemonFixture::DaemonFixture() {
  process.clientBundle().setPublicKey(StorebagBuilder::publicKey());
  world.network().answer(StorebagBuilder::kPostURL, NetworkAnswer::ok());
}

DaemonFixture::~DaemonFixture() {
  world.end();
  service.reset();
}

void DaemonFixture::startDaemon() {
  if (service != nullptr) return;
  service = std::make_unique<TelvanedService>(process.platform());
  ASSERT_TRUE(isOk(service->start()));
}

TelvanedAgent& DaemonFixture::agent() {
  startDaemon();
  return service->agent();
}

void DaemonFixture::givenDefault(const Key& suite, const Key& key, Value value) {
  ASSERT_TRUE(isOk(process.userDefaults().setObject(suite.view(), key.view(), std::move(value))));
}

void DaemonFixture::givenStorebag(const StorebagBuilder& bag, const std::string& name) {
  constexpr int kDay = 86400;
  process.files().place("~/Library/Caches/telvaned/storebags/" + name, bag.envelope());
  ASSERT_TRUE(
      isOk(process.userDefaults().setObject(kTelvaneDefaultsSuite.view(), "CACHED_" + name + "_max-age", Value(kDay))));
}

void DaemonFixture::givenSection(Dictionary section) {
  StorebagBuilder bag;
  bag.set(kEnvironmentRelease, section);
  bag.set(kEnvironmentInternal, std::move(section));
  givenStorebag(bag);
}

Dictionary DaemonFixture::sectionOf(std::initializer_list<std::pair<const char*, Dictionary>> backends) {
  Dictionary section;
  for (const auto& [name, client] : backends) section.addEntriesFrom(StorebagBuilder::section(name, client));
  return section;
}

Dictionary DaemonFixture::clientWith(const Key& key, Value value) {
  Dictionary client = StorebagBuilder::permissiveClient();
  client.set(key, std::move(value));
  return client;
}

Dictionary DaemonFixture::sessionInfo(int clientType, uint32_t sessionID) {
  return {{kTelvaneSessionInfoClientType, clientType},
          {kTelvaneSessionInfoSessionID, sessionID},
          {kTelvaneSessionInfoClientVersion, 3},
          {kTelvaneSessionInfoBatchEvent, true},
          {kTelvaneSessionInfoRequireUserInfo, true}};
}

Dictionary DaemonFixture::sessionInfoIn(const char* token, int level, uint32_t sessionID) {
  Dictionary info = sessionInfo(kClientType, sessionID);
  info.set(kTelvaneSessionInfoHierarchyToken,
           Dictionary{{kTelvaneHierarchyTokenTokenID, token}, {kTelvaneHierarchyTokenLevel, level}});
  return info;
}

Dictionary DaemonFixture::userInfo(const char* client, const char* service) {
  return {{kTelvaneUserInfoClientName, client}, {kTelvaneUserInfoServiceName, service}};
}

std::unique_ptr<DaemonClient> DaemonFixture::connect() {
  startDaemon();
  return std::make_unique<DaemonClient>(world, _clientProcess);
}

std::unique_ptr<DaemonClient> DaemonFixture::openSession(Dictionary info, Value user, bool hasAggregationBlock) {
  auto client = connect();
  client->setSessionInfo(std::move(info), std::move(user), hasAggregationBlock);
  return client;
}

std::unique_ptr<DaemonClient> DaemonFixture::startSession(Dictionary info, Value user, bool hasAggregationBlock) {
  auto client = openSession(std::move(info), std::move(user), hasAggregationBlock);
  client->start();
  return client;
}

std::vector<std::shared_ptr<TelvanedSession>> DaemonFixture::sessions() {
  std::vector<std::shared_ptr<TelvanedSession>> list;
  Dictionary storebags;
  agent().copyReportingAgentState(list, storebags);
  return list;
}

Dictionary DaemonFixture::cachedStorebags() {
  std::vector<std::shared_ptr<TelvanedSession>> list;
  Dictionary storebags;
  agent().copyReportingAgentState(list, storebags);
  return storebags;
}

std::vector<Dictionary> DaemonFixture::postedEvents() {
  std::vector<Dictionary> events;
  for (const RecordedRequest& recorded : world.network().requestsTo(StorebagBuilder::kPostURL)) {
    const Value body = RecordingConnectivity::bodyValue(recorded.request);
    if (!body.isDictionary()) continue;
    const Array* list = (*body.dictionary())[kBodyEvents].array();
    if (list == nullptr) continue;
    for (const Value& event : *list) events.push_back(*event.dictionary());
  }
  return events;
}

std::vector<Dictionary> DaemonFixture::postedEvents(int method, int status) {
  std::vector<Dictionary> events = postedEvents();
  std::erase_if(events, [method, status](const Dictionary& event) {
    return event[kEventMethod] != Value(method) || event[kEventStatus] != Value(status);
  });
  return events;
}

}  // namespace telvane::testing
