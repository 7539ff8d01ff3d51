// A client process that does what a script says, and says on standard output what it was told; see ClientScript.
//
//   telvane-scripted-client SCRIPT
#include <telvane/Telvane.h>

#include <chrono>
#include <fstream>
#include <functional>
#include <future>
#include <iostream>
#include <iterator>
#include <map>
#include <stdexcept>
#include <string>
#include <vector>

#include "tests/endtoend/ClientScript.h"

namespace {

using namespace telvane;
using telvane::testing::ClientScript;

constexpr auto kPatience = std::chrono::seconds(50);

std::string namesOf(const Value& names) {
  if (names.array() == nullptr) return "nothing";
  std::string text;
  for (const Value& name : *names.array()) text += (text.empty() ? "" : " ") + std::string(name.text());
  return "[" + text + "]";
}

// Carries out steps, one after the other.
class Runner {
 public:
  void run(const Dictionary& step) {
    using Method = void (Runner::*)(const Dictionary&);
    static const std::map<std::string, Method> kMethods = {
        {"open", &Runner::open},         {"configure", &Runner::configure},
        {"send", &Runner::send},         {"fetchStates", &Runner::fetchStates},
        {"flush", &Runner::flush},       {"share", &Runner::share},
        {"oneShot", &Runner::oneShot},   {"setDigestKey", &Runner::setDigestKey},
        {"wait", &Runner::waitForInput},
    };
    (this->*kMethods.at(std::string(step[ClientScript::kStep].text())))(step);
  }

 private:
  Telvane& session() { return *_sessions.back(); }

  // Runs what calls the given function with the answer, and says it, or that none came.
  static void say(const std::string& what, const std::function<void(std::function<void(std::string)>)>& ask) {
    auto answered = std::make_shared<std::promise<std::string>>();
    std::future<std::string> answer = answered->get_future();
    ask([answered](std::string text) { answered->set_value(std::move(text)); });
    const bool hasCome = answer.wait_for(kPatience) == std::future_status::ready;
    std::cout << what << ": " << (hasCome ? answer.get() : "no answer") << std::endl;
  }

  void open(const Dictionary& step) {
    auto opened = Telvane::initWithSessionInfo(step[ClientScript::kSessionInfo], step[ClientScript::kUserInfo]);
    if (opened == nullptr) throw std::runtime_error("no session");
    _sessions.push_back(std::move(opened));
  }

  void configure(const Dictionary&) {
    say("configured", [this](auto answer) {
      session().startConfigurationWithCompletionHandler([answer](const Value& names) { answer(namesOf(names)); });
    });
  }

  void fetchStates(const Dictionary& step) {
    say("states", [this, &step](auto answer) {
      session().fetchReportingStatesWithUserInfo(step[ClientScript::kUserInfo],
                                                 [answer](const Value& names) { answer(namesOf(names)); });
    });
  }

  void send(const Dictionary& step) {
    Dictionary message{{"ParametersCategory", step[ClientScript::kCategory]},
                       {"ParametersType", step[ClientScript::kType]},
                       {"ParametersFlag", step[ClientScript::kFlag]}};
    message.set("ParametersPayload", step[ClientScript::kPayload]);
    session().sendMessageWithDictionary(message);
  }

  void flush(const Dictionary&) {
    say("flushed", [this](auto answer) {
      session().flushMessagesWithCompletion([answer](const std::optional<Error>& error) {
        answer(error.has_value() ? "error " + std::to_string(error->code()) + " " + error->description() : "ok");
      });
    });
  }

  void share(const Dictionary& step) {
    session().updateSharedDataWithDictionary(*step[ClientScript::kPayload].dictionary());
  }

  void setDigestKey(const Dictionary& step) {
    session().setDigestKey(step[ClientScript::kKey], step[ClientScript::kAlgorithm].int32Value());
  }

  void oneShot(const Dictionary& step) {
    Telvane::sendOneMessageWithSessionInfo(step[ClientScript::kSessionInfo], step[ClientScript::kUserInfo],
                                           step[ClientScript::kCategory].low16Bits(),
                                           step[ClientScript::kType].low16Bits(), step[ClientScript::kPayload]);
  }

  void waitForInput(const Dictionary&) {
    std::cout << "waiting" << std::endl;
    std::string line;
    std::getline(std::cin, line);
  }

  std::vector<std::shared_ptr<Telvane>> _sessions;
};

}  // namespace

int main(int argc, char** argv) {
  if (argc != 2) {
    std::cerr << "usage: telvane-scripted-client SCRIPT" << std::endl;
    return 2;
  }
  std::ifstream file(argv[1], std::ios::binary);
  const std::string text{std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
  Runner runner;
  for (const Value& step : ClientScript::parse(text)) runner.run(*step.dictionary());
  return 0;
}
