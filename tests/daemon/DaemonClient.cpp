#include "tests/daemon/DaemonClient.h"

#include <fcntl.h>

#include "interfaces/SessionKeys.h"

namespace telvane::testing {

class DaemonClient::AggregationObject : public ipc::ExportedObject {
 public:
  void invoke(ipc::Invocation invocation, ipc::ReplyBlock) override { calls.push_back(invocation.arguments); }
  std::vector<Array> calls;
};

DaemonClient::DaemonClient(SimulatedWorld& world, SimulatedPlatform& process)
    : _world(world),
      _object(std::make_shared<AggregationObject>()),
      _connection(process.platform().localService.newConnection(kTelvanedServiceName).value()) {
  _connection->setExportedObject(_object);
  _connection->setInterruptionHandler([isInvalidated = _isInvalidated] { *isInvalidated = true; });
  _connection->setInvalidationHandler([isInvalidated = _isInvalidated] { *isInvalidated = true; });
  _connection->resume();
  _world.runUntilIdle();
}

void DaemonClient::tell(Operation operation, Array arguments) {
  _connection->send({static_cast<uint16_t>(operation), std::move(arguments), {}}, {});
  _world.runUntilIdle();
}

std::shared_ptr<Answer> DaemonClient::askInPassing(Operation operation, Array arguments, int descriptor) {
  const auto answer = std::make_shared<Answer>();
  _connection->sendWithReply(
      {static_cast<uint16_t>(operation), std::move(arguments), ipc::Descriptor(descriptor)},
      [answer](Array values) { answer->values = std::move(values); },
      [answer](const Error& error) { answer->error = error; });
  return answer;
}

Answer DaemonClient::ask(Operation operation, Array arguments) {
  const auto answer = askInPassing(operation, std::move(arguments));
  _world.runUntilIdle();
  return *answer;
}

std::shared_ptr<Answer> DaemonClient::uploadInPassing(const std::string& fileURL, const ExtensionToken& token) {
  return askInPassing(Operation::UploadFileAtPath, {fileURL}, ::fcntl(token.descriptor, F_DUPFD_CLOEXEC, 0));
}

Answer DaemonClient::upload(const std::string& fileURL, const ExtensionToken& token) {
  const auto answer = uploadInPassing(fileURL, token);
  _world.runUntilIdle();
  return *answer;
}

Answer DaemonClient::send(int category, int type, Dictionary payload) {
  return sendMessage(Dictionary{{kTelvaneMessageParametersCategory, category},
                                {kTelvaneMessageParametersType, type},
                                {kTelvaneMessageParametersPayload, std::move(payload)}});
}

Answer DaemonClient::sendOneMessage(Value sessionInfo, Value userInfo, Value payload) {
  return ask(Operation::SendMessageWithSessionInfo,
             {std::move(sessionInfo), std::move(userInfo), 7, 2, std::move(payload)});
}

void DaemonClient::close() {
  if (_connection == nullptr) return;
  _connection->invalidate();
  _connection.reset();
  _world.runUntilIdle();
}

const std::vector<Array>& DaemonClient::aggregated() const { return _object->calls; }

}  // namespace telvane::testing
