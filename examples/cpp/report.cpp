// Reports a few events from a C++ program: opens a session, asks for its configuration, sends, flushes, lets go.
//
//   report-cpp [CLIENT-TYPE]        a number from 5 to 30, 7 when it is left out
//
// Exits with 0 when the daemon has taken everything, with 1 when it could not be reached, with 2 on wrong usage.

#include <telvane/Telvane.h>
#include <telvane/TelvaneConstants.h>

#include <chrono>
#include <cstdlib>
#include <future>
#include <iostream>
#include <memory>
#include <string>

namespace {

using telvane::Array;
using telvane::Dictionary;
using telvane::Error;
using telvane::String;
using telvane::Telvane;
using telvane::Value;

constexpr int kEventCount = 5;
constexpr std::chrono::seconds kPatience{30};

std::shared_ptr<Telvane> openSession(int clientType) {
  Dictionary sessionInfo;
  sessionInfo.set(kTelvaneSessionInfoClientType, clientType);
  sessionInfo.set(kTelvaneSessionInfoSessionID, 2);
  sessionInfo.set(kTelvaneSessionInfoClientVersion, 3);
  sessionInfo.set(kTelvaneSessionInfoBatchEvent, true);
  Dictionary userInfo;
  userInfo.set(kTelvaneUserInfoClientName, "example-cpp");
  userInfo.set(kTelvaneUserInfoServiceName, "demo");
  return Telvane::initWithSessionInfo(sessionInfo, userInfo);
}

// Completions run on threads of the library; a promise brings their answer here.
bool configure(Telvane& session) {
  auto promise = std::make_shared<std::promise<void>>();
  std::future<void> isConfigured = promise->get_future();
  session.startConfigurationWithCompletionHandler([promise](const Value& enabledBackendNames) {
    const Array* names = enabledBackendNames.array();
    std::cout << "configured: " << (names != nullptr ? names->size() : 0) << " enabled backends\n";
    if (names != nullptr) {
      for (const Value& name : *names) std::cout << "  " << name.text() << "\n";
    }
    promise->set_value();
  });
  return isConfigured.wait_for(kPatience) == std::future_status::ready;
}

bool send(Telvane& session, int number) {
  Dictionary payload;
  payload.set("frame", number);
  payload.set("quality", 0.25 * number);
  payload.set("codec", "opus");
  payload.set("muted", number % 2 == 1);
  std::optional<Error> error;
  const bool isSent = session.sendMessageWithCategory(12, 2, payload, &error);
  if (error) std::cout << "event " << number << " was refused: " << error->description() << "\n";
  return isSent;
}

bool flush(Telvane& session) {
  auto promise = std::make_shared<std::promise<bool>>();
  std::future<bool> isFlushed = promise->get_future();
  session.flushMessagesWithCompletion([promise](const std::optional<Error>& error) {
    std::cout << (error ? "flush failed: " + error->description() : std::string("flushed")) << "\n";
    promise->set_value(!error);
  });
  return isFlushed.wait_for(kPatience) == std::future_status::ready && isFlushed.get();
}

}  // namespace

int main(int argc, char** argv) {
  if (argc > 2) {
    std::cerr << "usage: " << argv[0] << " [CLIENT-TYPE]\n";
    return 2;
  }
  std::shared_ptr<Telvane> session = openSession(argc > 1 ? std::atoi(argv[1]) : 7);
  if (session == nullptr) {
    std::cerr << "no session: the client type must be 5 to 30, and the daemon within reach\n";
    return 1;
  }
  session->setMessageLoggingBlock([](const String& text) { std::cout << "the daemon says: " << text.view() << "\n"; });
  if (!configure(*session)) {
    std::cerr << "no configuration: is telvaned running?\n";
    return 1;
  }

  int sent = 0;
  for (int number = 1; number <= kEventCount; ++number) sent += send(*session, number) ? 1 : 0;
  std::cout << "sent " << sent << " events\n";

  const bool isFlushed = flush(*session);
  session.reset();
  std::cout << "released\n";
  return isFlushed && sent == kEventCount ? 0 : 1;
}
