#pragma once

#include <string>

#include "connectivity/ReportingSessionConnectivityInterface.h"
#include "platform/Log.h"

namespace telvane {

// Collects the response body of one URL task until it completes. Owned by its helper's table of tasks, confined to the
// helper's state queue.
class ConnectivityHelperTask {
 public:
  // description: the task's key in the helper's table.
  ConnectivityHelperTask(Log& log, std::string taskDescription, RequestCompletion completion);
  ConnectivityHelperTask(const ConnectivityHelperTask&) = delete;
  ConnectivityHelperTask& operator=(const ConnectivityHelperTask&) = delete;
  ~ConnectivityHelperTask();

  RequestCompletion& completionHandler() noexcept { return _completionHandler; }
  void appendReceivedData(const Data& data) { _receivedData.append(data.view()); }
  // Hands the body received so far over to the caller.
  Data takeReceivedData() { return Data(std::move(_receivedData)); }

 private:
  Log& _log;
  const std::string _taskDescription;
  RequestCompletion _completionHandler;
  std::string _receivedData;
};

}  // namespace telvane
