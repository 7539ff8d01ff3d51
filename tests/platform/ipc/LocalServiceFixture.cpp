#include "tests/platform/ipc/LocalServiceFixture.h"

#include <utility>

namespace telvane::testing {

bool AcceptingDelegate::listener(ipc::Listener&, std::shared_ptr<ipc::Connection> connection) {
  if (!accepts || (!entitlement.empty() && !connection->peerHasEntitlement(entitlement))) return false;
  connection->setExportedObject(object);
  connection->setInterruptionHandler([this] { events.add("interrupted"); });
  connection->setInvalidationHandler([this] { events.add("invalidated"); });
  connection->resume();
  connections.add(connection);
  return true;
}

LocalServiceFixture::LocalServiceFixture()
    : files(Paths{scratch.path(), scratch.path()}), entitlements(files, log), delegate(dispatch) {}

LocalServiceFixture::~LocalServiceFixture() {
  delegate.object->release(1000);
  client.reset();
  stopServing();
  ownDispatch.reset();  // runs what is left, while all that it touches still exists
}

void LocalServiceFixture::serve() {
  daemon = std::make_unique<ipc::SocketService>(files, dispatch, log, entitlements, &gate, daemonLimits);
  auto made = daemon->newListener(kServiceName);
  ASSERT_TRUE(made) << made.error().description();
  listener = std::move(*made);
  listener->setDelegate(&delegate);
  listener->resume();
}

void LocalServiceFixture::stopServing() {
  listener.reset();
  daemon.reset();
}

std::shared_ptr<ipc::Connection> LocalServiceFixture::newConnection() {
  if (!client) client = std::make_unique<ipc::SocketService>(files, dispatch, log, entitlements, nullptr, clientLimits);
  auto made = client->newConnection(kServiceName);
  if (!made) throw std::runtime_error(made.error().description());
  (*made)->setInterruptionHandler([this] { clientEvents.add("interrupted"); });
  (*made)->setInvalidationHandler([this] { clientEvents.add("invalidated"); });
  return *made;
}

std::shared_ptr<ipc::Connection> LocalServiceFixture::connected() {
  auto connection = newConnection();
  connection->resume();
  return connection;
}

void LocalServiceFixture::call(ipc::Connection& connection, uint16_t operation, Array arguments) {
  ipc::Invocation invocation;
  invocation.operation = operation;
  invocation.arguments = std::move(arguments);
  connection.sendWithReply(
      std::move(invocation),
      [this](Array values) {
        outcomes.add({std::move(values), {}});
      },
      [this](const Error& error) {
        outcomes.add({{}, error});
      });
}

Outcome LocalServiceFixture::callAndWait(ipc::Connection& connection, uint16_t operation, Array arguments) {
  const size_t before = outcomes.size();
  call(connection, operation, std::move(arguments));
  const auto all = outcomes.take(before + 1);
  return all.size() > before ? all[before] : Outcome{{}, Error("no outcome in time", 0)};
}

void LocalServiceFixture::send(ipc::Connection& connection, uint16_t operation, Array arguments) {
  ipc::Invocation invocation;
  invocation.operation = operation;
  invocation.arguments = std::move(arguments);
  connection.send(std::move(invocation), {});
}

void LocalServiceFixture::expectServing() {
  const auto connection = connected();
  const auto outcome = callAndWait(*connection, TalkingObject::kEcho, {Value("still there")});
  ASSERT_TRUE(outcome.values) << outcome.error.description();
  EXPECT_EQ(*outcome.values, Array({Value("still there")}));
}

}  // namespace telvane::testing
