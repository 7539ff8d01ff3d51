// A client process that speaks to the daemon's sessions without the library, as a script says; see WireScript.
//
//   telvane-soak-client SCRIPT
#include <chrono>
#include <fstream>
#include <functional>
#include <future>
#include <iostream>
#include <iterator>
#include <map>
#include <memory>
#include <stdexcept>
#include <string>
#include <vector>

#include "client/ClientRuntime.h"
#include "client/ClientSessionProxy.h"
#include "interfaces/SessionKeys.h"
#include "tests/soak/WireScript.h"

namespace {

using namespace telvane;
using telvane::testing::WireScript;

constexpr auto kPatience = std::chrono::seconds(100);
constexpr uint16_t kType = 1;

// What a reply block calls; the question is over when it was called or let go.
using Answered = std::shared_ptr<std::promise<std::string>>;

std::string namesOf(const Value& names) {
  if (names.array() == nullptr) return "nothing";
  std::string text;
  for (const Value& name : *names.array()) text += (text.empty() ? "" : " ") + std::string(name.text());
  return "[" + text + "]";
}

// Carries out steps, one after the other.
class Runner {
 public:
  ~Runner() {
    for (const auto& connection : _connections) connection->invalidate();
  }

  void run(const Dictionary& step) {
    using Method = void (Runner::*)(const Dictionary&);
    static const std::map<std::string, Method> kMethods = {
        {"open", &Runner::open},        {"tellAgain", &Runner::tell}, {"configure", &Runner::configure},
        {"send", &Runner::send},        {"flush", &Runner::flush},    {"oneShot", &Runner::oneShot},
        {"wait", &Runner::waitForInput}};
    (this->*kMethods.at(std::string(step[WireScript::kStep].text())))(step);
  }

 private:
  static std::shared_ptr<ipc::Connection> connect() {
    auto made = ClientRuntime::current().context().platform().localService.newConnection(kTelvanedServiceName);
    if (!made) throw std::runtime_error("no connection");
    (*made)->resume();
    return *made;
  }
  static ClientSessionProxy proxyOf(ipc::Connection& connection) {
    return ClientSessionProxy::remoteObjectProxyWithErrorHandler(connection, {});
  }
  ClientSessionProxy session() { return proxyOf(*_connections.back()); }

  // Asks and waits; "nothing" when the answer can no longer come.
  static std::string answerTo(const std::function<void(Answered)>& ask) {
    std::future<std::string> answer;
    {
      const auto answered = std::make_shared<std::promise<std::string>>();
      answer = answered->get_future();
      ask(answered);
    }
    if (answer.wait_for(kPatience) != std::future_status::ready) return "too late";
    try {
      return answer.get();
    } catch (const std::future_error&) {
      return "nothing";
    }
  }

  void open(const Dictionary& step) {
    _connections.push_back(connect());
    tell(step);
  }

  void tell(const Dictionary& step) {
    session().setSessionInfo(*step[WireScript::kSessionInfo].dictionary(), step[WireScript::kUserInfo], {}, false);
  }

  void configure(const Dictionary&) {
    std::cout << "configured: " << answerTo([this](const Answered& answered) {
      session().startConfigWithCompletionHandler(
          [answered](const Value& names, const Value&, const Value&) { answered->set_value(namesOf(names)); });
    }) << std::endl;
  }

  void send(const Dictionary& step) {
    Dictionary message{{kTelvaneMessageParametersType, kType}};
    message.set(kTelvaneMessageParametersCategory, step[WireScript::kCategory]);
    message.set(kTelvaneMessageParametersPayload, step[WireScript::kPayload]);
    session().sendMessageWithDictionary(std::move(message), [](const Value&) {});
  }

  void flush(const Dictionary&) {
    const std::string answer = answerTo([this](const Answered& answered) {
      session().flushMessagesWithCompletion(
          [answered](const Value&, const std::optional<Error>&) { answered->set_value("flushed"); });
    });
    std::cout << answer << std::endl;
  }

  // The daemon sends what it has of the message when the connection ends.
  void oneShot(const Dictionary& step) {
    const std::shared_ptr<ipc::Connection> connection = connect();
    const std::string answer = answerTo([&connection, &step](const Answered& answered) {
      proxyOf(*connection)
          .sendMessageWithSessionInfo(*step[WireScript::kSessionInfo].dictionary(), step[WireScript::kUserInfo],
                                      step[WireScript::kCategory].low16Bits(), kType,
                                      *step[WireScript::kPayload].dictionary(),
                                      [answered](const String& status) { answered->set_value(status.str()); });
    });
    connection->invalidate();
    std::cout << "one-shot: " << answer << std::endl;
  }

  void waitForInput(const Dictionary&) {
    std::cout << "waiting" << std::endl;
    std::string line;
    std::getline(std::cin, line);
  }

  std::vector<std::shared_ptr<ipc::Connection>> _connections;
};

}  // namespace

int main(int argc, char** argv) {
  if (argc != 2) {
    std::cerr << "usage: telvane-soak-client SCRIPT" << std::endl;
    return 2;
  }
  std::ifstream file(argv[1], std::ios::binary);
  const std::string text{std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
  Runner runner;
  for (const Value& step : WireScript::parse(text)) runner.run(*step.dictionary());
  return 0;
}
