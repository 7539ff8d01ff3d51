#pragma once

#include <gtest/gtest.h>

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "connectivity/ReportingSessionConnectivityHelper.h"
#include "interfaces/SessionKeys.h"
#include "tests/support/SimulatedWorld.h"

namespace telvane::testing {

// The owner's side of a helper: notes what is given back.
class RecordingHelperDelegate : public ConnectivityHelperDelegate {
 public:
  explicit RecordingHelperDelegate(Dispatch& dispatch) : _monitor(dispatch.newMonitor()) {}
  void releaseXPCTransactions(uint32_t count) override { released.push_back(count); }
  Monitor& monitor() override { return *_monitor; }
  std::vector<uint32_t> released;

 private:
  const std::unique_ptr<Monitor> _monitor;
};

// What a request's completion was called with.
struct Completion {
  std::string data;
  int status = 0;  // 0: no response
  std::optional<Error> error;
};

// One helper on a simulated machine.
class ConnectivityHelperFixture : public ::testing::Test {
 protected:
  static constexpr char kURL[] = "https://collector.example/bag";

  ConnectivityHelperFixture()
      : context(process.platform()),
        delegate(std::make_shared<RecordingHelperDelegate>(process.platform().dispatch)),
        ownerQueue(process.platform().dispatch.newSerialQueue("owner")) {}
  ~ConnectivityHelperFixture() override {
    world.end();
    helper.reset();
  }

  void givenHelper(int32_t mode) {
    helper = ReportingSessionConnectivityHelper::initWithDelegate(
        context, shared, delegate, mode,
        {{kTelvaneUserInfoClientName, "Phone"}, {kTelvaneUserInfoServiceName, "Calls"}});
  }
  void givenActiveHelper(int32_t mode, uint32_t releaseTimeout = 30) {
    givenHelper(mode);
    helper->activate(releaseTimeout);
    world.runUntilIdle();
  }
  URLRequest request(std::string url = kURL) {
    URLRequest made;
    made.url = std::move(url);
    return made;
  }
  RequestCompletion noteCompletion() {
    return [this](const Data& data, const URLResponse* response, const std::optional<Error>& error) {
      completions.push_back({std::string(data.view()), response != nullptr ? response->statusCode : 0, error});
    };
  }
  void get(bool isUrgent = true) {
    helper->getURLRequestWithCompletionHandler(request(), isUrgent, noteCompletion());
    world.runUntilIdle();
  }
  void post(const char* url = kURL) {
    URLRequest made = request(url);
    made.method = "POST";
    helper->postURLRequestWithCompletionHandler(std::move(made), noteCompletion());
    world.runUntilIdle();
  }
  void increment() {
    helper->ownerIncrementUsageCount();
    world.runUntilIdle();
  }
  void decrement() {
    helper->ownerDecrementUsageCountWithBlock([this](uint32_t count) { toldCounts.push_back(count); }, ownerQueue);
    world.runUntilIdle();
  }
  RecordingLog& log() { return process.log(); }

  SimulatedWorld world;
  SimulatedPlatform& process = world.makeProcess("telvaned");
  ProcessContext context;
  ConnectivityShared shared;
  std::shared_ptr<RecordingHelperDelegate> delegate;
  std::shared_ptr<SerialQueue> ownerQueue;
  std::shared_ptr<ReportingSessionConnectivityHelper> helper;
  std::vector<Completion> completions;
  std::vector<uint32_t> toldCounts;
};

}  // namespace telvane::testing
