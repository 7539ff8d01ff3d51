#include "connectivity/ConnectivityHelperTask.h"

namespace telvane {

ConnectivityHelperTask::ConnectivityHelperTask(Log& log, std::string taskDescription, RequestCompletion completion)
    : _log(log), _taskDescription(std::move(taskDescription)), _completionHandler(std::move(completion)) {
  _log.message("ConnectivityHelperTask with ID <{}> created", _taskDescription);
}

ConnectivityHelperTask::~ConnectivityHelperTask() {
  _log.message("ConnectivityHelperTask with ID <{}> dealloced", _taskDescription);
}

}  // namespace telvane
