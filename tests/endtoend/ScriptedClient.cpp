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
#include <mutex>
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

// Lines come from blocks, too, so each is said as one.
void sayLine(const std::string& text) {
  static std::mutex mutex;
  const std::lock_guard lock(mutex);
  std::cout << text << std::endl;
}

// A session that its own blocks may use, and let go of, from other threads. Safe from any thread.
class HeldSession {
 public:
  void hold(std::shared_ptr<Telvane> session) {
    const std::lock_guard lock(_mutex);
    if (!_isLetGo) _session = std::move(session);
  }
  std::shared_ptr<Telvane> get() {
    const std::lock_guard lock(_mutex);
    return _session;
  }
  void letGo() {
    std::shared_ptr<Telvane> last;
    const std::lock_guard lock(_mutex);
    _isLetGo = true;
    last.swap(_session);
  }

 private:
  std::mutex _mutex;
  std::shared_ptr<Telvane> _session;
  bool _isLetGo = false;
};

constexpr uint16_t kReactedTo = 21;
constexpr uint16_t kReaction = 30;

void react(const std::string& reaction, HeldSession& held, const Value& payload) {
  if (reaction == "throw") throw std::runtime_error("thrown by an aggregation block");
  if (reaction == "let go") return held.letGo();
  const std::shared_ptr<Telvane> session = held.get();
  if (reaction != "send" || session == nullptr) return;
  session->sendMessageWithCategory(kReaction, 1, payload);
  session->flushMessages();
}

void hear(const std::string& reaction, HeldSession& held, uint16_t category, uint16_t type, const Value& payload) {
  if (category == 0 && !payload.isPresent()) return sayLine("aggregated: end");
  const Dictionary fields = payload.isDictionary() ? *payload.dictionary() : Dictionary();
  sayLine("aggregated: " + std::to_string(category) + " " + std::to_string(type) + " " +
          std::string(fields["from"].text()) + " " + std::to_string(fields["n"].integerValue()));
  if (category == kReactedTo) react(reaction, held, payload);
}

// Carries out steps, one after the other.
class Runner {
 public:
  // A session's block holds the session.
  ~Runner() {
    for (const auto& held : _sessions) held->letGo();
  }
  void run(const Dictionary& step) {
    using Method = void (Runner::*)(const Dictionary&);
    static const std::map<std::string, Method> kMethods = {
        {"open", &Runner::open},         {"configure", &Runner::configure},
        {"send", &Runner::send},         {"fetchStates", &Runner::fetchStates},
        {"flush", &Runner::flush},       {"share", &Runner::share},
        {"oneShot", &Runner::oneShot},   {"setDigestKey", &Runner::setDigestKey},
        {"wait", &Runner::waitForInput}, {"openAggregating", &Runner::openAggregating},
        {"letGo", &Runner::letGo},       {"sendMany", &Runner::sendMany},
        {"upload", &Runner::upload},     {"uploadLogData", &Runner::uploadLogData},
    };
    (this->*kMethods.at(std::string(step[ClientScript::kStep].text())))(step);
  }

 private:
  std::shared_ptr<Telvane> session() {
    std::shared_ptr<Telvane> held = _sessions.back()->get();
    if (held == nullptr) throw std::runtime_error("the session has been let go");
    return held;
  }

  // Runs what calls the given function with the answer, and says it, or that none came.
  static void say(const std::string& what, const std::function<void(std::function<void(std::string)>)>& ask,
                  std::chrono::seconds patience = kPatience) {
    auto answered = std::make_shared<std::promise<std::string>>();
    std::future<std::string> answer = answered->get_future();
    ask([answered](std::string text) { answered->set_value(std::move(text)); });
    const bool hasCome = answer.wait_for(patience) == std::future_status::ready;
    sayLine(what + ": " + (hasCome ? answer.get() : "no answer"));
  }

  void open(const Dictionary& step) {
    auto opened = Telvane::initWithSessionInfo(step[ClientScript::kSessionInfo], step[ClientScript::kUserInfo]);
    if (opened == nullptr) throw std::runtime_error("no session");
    _sessions.push_back(std::make_shared<HeldSession>());
    _sessions.back()->hold(std::move(opened));
  }

  void openAggregating(const Dictionary& step) {
    const auto held = std::make_shared<HeldSession>();
    auto opened =
        Telvane::initWithSessionInfo(step[ClientScript::kSessionInfo], step[ClientScript::kUserInfo], {},
                                     [held, reaction = std::string(step[ClientScript::kReaction].text())](
                                         const Value&, double, uint16_t category, uint16_t type, const Value& payload) {
                                       hear(reaction, *held, category, type, payload);
                                     });
    if (opened == nullptr) throw std::runtime_error("no session");
    held->hold(std::move(opened));
    _sessions.push_back(held);
  }

  void letGo(const Dictionary&) { _sessions.back()->letGo(); }

  void configure(const Dictionary& step) {
    say(
        "configured",
        [this](auto answer) {
          session()->startConfigurationWithCompletionHandler([answer](const Value& names) { answer(namesOf(names)); });
        },
        step.contains(ClientScript::kSeconds) ? std::chrono::seconds(step[ClientScript::kSeconds].integerValue())
                                              : kPatience);
  }

  void fetchStates(const Dictionary& step) {
    say("states", [this, &step](auto answer) {
      session()->fetchReportingStatesWithUserInfo(step[ClientScript::kUserInfo],
                                                  [answer](const Value& names) { answer(namesOf(names)); });
    });
  }

  void send(const Dictionary& step) {
    Dictionary message{{"ParametersCategory", step[ClientScript::kCategory]},
                       {"ParametersType", step[ClientScript::kType]},
                       {"ParametersFlag", step[ClientScript::kFlag]}};
    message.set("ParametersPayload", step[ClientScript::kPayload]);
    session()->sendMessageWithDictionary(message);
  }

  void sendMany(const Dictionary& step) {
    const std::string text(static_cast<size_t>(step[ClientScript::kTextSize].integerValue()), 'x');
    const int64_t first = step[ClientScript::kFirst].integerValue();
    const int64_t count = step[ClientScript::kCount].integerValue();
    for (int64_t n = first; n < first + count; ++n) {
      Dictionary payload{{"n", n}};
      payload.set("from", step[ClientScript::kFrom]);
      if (!text.empty()) payload.set("text", text);
      session()->sendMessageWithCategory(step[ClientScript::kCategory].low16Bits(), 1, payload);
    }
  }

  void flush(const Dictionary&) {
    say("flushed", [this](auto answer) {
      session()->flushMessagesWithCompletion([answer](const std::optional<Error>& error) {
        answer(error.has_value() ? "error " + std::to_string(error->code()) + " " + error->description() : "ok");
      });
    });
  }

  void upload(const Dictionary& step) {
    auto answered = std::make_shared<std::promise<bool>>();
    const bool isHandedOver = session()->uploadFileWithURL(
        String(step[ClientScript::kPath].text()),
        [answered](bool isSuccess, const std::optional<Error>&) { answered->set_value(isSuccess); });
    sayLine(isHandedOver ? "handed over: yes" : "handed over: no");
    if (!isHandedOver) return;
    std::future<bool> answer = answered->get_future();
    const bool hasCome = answer.wait_for(kPatience) == std::future_status::ready;
    sayLine(std::string("uploaded: ") + (!hasCome ? "no answer" : answer.get() ? "yes" : "no"));
  }

  void uploadLogData(const Dictionary& step) {
    auto answered = std::make_shared<std::promise<bool>>();
    std::future<bool> answer = answered->get_future();
    const bool isTaken = session()->uploadDataArray(
        *step[ClientScript::kPayload].array(),
        [answered](bool isSuccess, const std::optional<Error>&) { answered->set_value(isSuccess); });
    const bool hasCome = isTaken && answer.wait_for(kPatience) == std::future_status::ready;
    sayLine(std::string("log data uploaded: ") + (!hasCome ? "no answer" : answer.get() ? "yes" : "no"));
  }

  void share(const Dictionary& step) {
    session()->updateSharedDataWithDictionary(*step[ClientScript::kPayload].dictionary());
  }

  void setDigestKey(const Dictionary& step) {
    session()->setDigestKey(step[ClientScript::kKey], step[ClientScript::kAlgorithm].int32Value());
  }

  void oneShot(const Dictionary& step) {
    Telvane::sendOneMessageWithSessionInfo(step[ClientScript::kSessionInfo], step[ClientScript::kUserInfo],
                                           step[ClientScript::kCategory].low16Bits(),
                                           step[ClientScript::kType].low16Bits(), step[ClientScript::kPayload]);
  }

  void waitForInput(const Dictionary&) {
    sayLine("waiting");
    std::string line;
    std::getline(std::cin, line);
  }

  std::vector<std::shared_ptr<HeldSession>> _sessions;
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
