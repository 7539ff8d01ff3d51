// A client process for the end-to-end tests: opens a session, configures it, sends events, flushes, and says on
// standard output what it was told, one line each.
//
//   telvane-event-sender [--client-type N] [--client-name NAME] [--count N] [--no-flush] [--again]
//
// --again: then waits for a line on standard input (or its end) and sends and flushes once more.
#include <telvane/Telvane.h>

#include <chrono>
#include <future>
#include <iostream>
#include <string>

#include "foundation/Description.h"

namespace {

using namespace telvane;

constexpr auto kPatience = std::chrono::seconds(40);
constexpr uint16_t kCategory = 21;

struct Options {
  int clientType = 7;
  std::string clientName = "sender";
  int count = 3;
  bool isFlushing = true;
  bool isSendingAgain = false;
};

Options parse(int argc, char** argv) {
  Options options;
  for (int i = 1; i < argc; ++i) {
    const std::string argument = argv[i];
    if (argument == "--no-flush") options.isFlushing = false;
    if (argument == "--again") options.isSendingAgain = true;
    if (i + 1 >= argc) continue;
    if (argument == "--client-type") options.clientType = std::stoi(argv[i + 1]);
    if (argument == "--client-name") options.clientName = argv[i + 1];
    if (argument == "--count") options.count = std::stoi(argv[i + 1]);
  }
  return options;
}

// Says what the answer was, or that none came: a call whose daemon is gone tells its completion nothing.
void say(const std::string& what, std::future<std::string> answer) {
  const bool hasCome = answer.wait_for(kPatience) == std::future_status::ready;
  std::cout << what << ": " << (hasCome ? answer.get() : "no answer") << std::endl;
}

void configure(Telvane& session) {
  auto answered = std::make_shared<std::promise<std::string>>();
  std::future<std::string> answer = answered->get_future();
  session.startConfigurationWithCompletionHandler([answered](const Value& names) {
    std::string text;
    if (const Array* list = names.array()) {
      for (const Value& name : *list) text += (text.empty() ? "" : " ") + std::string(name.text());
    }
    answered->set_value(names.isPresent() ? "[" + text + "]" : "nothing");
  });
  say("configured", std::move(answer));
}

void flush(Telvane& session) {
  auto answered = std::make_shared<std::promise<std::string>>();
  std::future<std::string> answer = answered->get_future();
  session.flushMessagesWithCompletion([answered](const std::optional<Error>& error) {
    answered->set_value(error.has_value() ? "error " + std::to_string(error->code()) + " " + error->description()
                                          : "ok");
  });
  say("flushed", std::move(answer));
}

void send(Telvane& session, const Options& options) {
  for (int i = 0; i < options.count; ++i) {
    Dictionary payload;
    payload.set("number", Value(i));
    payload.set("text", Value("event " + std::to_string(i)));
    payload.set("isEven", Value(i % 2 == 0));
    session.sendMessageWithCategory(kCategory, 1, payload);
  }
  if (options.isFlushing) flush(session);
}

}  // namespace

int main(int argc, char** argv) {
  const Options options = parse(argc, argv);
  const Dictionary sessionInfo{{"ComponentType", options.clientType},
                               {"ClientVersion", 3},
                               {"SessionID", 77},
                               {"BatchEvents", true},
                               {"RequireUserDict", true}};
  const Dictionary userInfo{{"_clientName", options.clientName}, {"_serviceName", "endtoend"}};
  auto session = Telvane::initWithSessionInfo(sessionInfo, userInfo);
  if (session == nullptr) {
    std::cout << "no session" << std::endl;
    return 1;
  }
  configure(*session);
  send(*session, options);
  if (options.isSendingAgain) {
    std::string line;
    std::getline(std::cin, line);
    configure(*session);
    send(*session, options);
  }
  session.reset();
  return 0;
}
