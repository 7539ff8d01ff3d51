// The other process of the tests of the local connection.
//
//   serve ROOT [MOST]     serves until its input ends, with at most that many descriptors; its error lines are written
//                         to standard output, each in front of it "log "
//   call ROOT TEXT        calls once and writes "reply TEXT" or "error CODE"
//   fork ROOT             calls, forks, and lets both processes go on: the child with the parent's connection and with
//                         one of its own

#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <iostream>
#include <memory>
#include <string>
#include <vector>

#include "platform/dispatch/ThreadedDispatch.h"
#include "platform/ipc/Entitlements.h"
#include "platform/ipc/SocketService.h"
#include "platform/system/PosixFileSystem.h"
#include "tests/platform/ipc/TalkingObject.h"

namespace telvane::testing {
namespace {

constexpr const char* kServiceName = "com.corvex.test";
constexpr std::chrono::seconds kDeadline{30};

void say(const std::string& line) {
  const std::string bytes = line + "\n";
  if (::write(1, bytes.data(), bytes.size()) < 0) ::_exit(3);
}

class StandardOutputLog final : public Log {
 public:
  StandardOutputLog() : Log(LogLevel::Error) {}

 private:
  void write(LogLevel, std::string_view message) override { say("log " + std::string(message)); }
};

// All that a process needs of the platform, in the order in which it must go.
struct Process {
  explicit Process(const std::string& root)
      : files(Paths{root, root}), entitlements(files, log), service(files, *dispatch, log, entitlements) {}

  StandardOutputLog log;
  std::unique_ptr<ThreadedDispatch> dispatch = std::make_unique<ThreadedDispatch>();
  PosixFileSystem files;
  ipc::Entitlements entitlements;
  ipc::SocketService service;
};

class Delegate final : public ipc::ListenerDelegate {
 public:
  explicit Delegate(Dispatch& dispatch) : _object(std::make_shared<TalkingObject>(dispatch)) {}
  bool listener(ipc::Listener&, std::shared_ptr<ipc::Connection> connection) override {
    connection->setExportedObject(_object);
    connection->resume();
    return true;
  }

 private:
  const std::shared_ptr<TalkingObject> _object;
};

int serve(const std::vector<std::string>& arguments) {
  Process process(arguments[0]);
  Delegate delegate(*process.dispatch);
  auto listener = process.service.newListener(kServiceName);
  if (!listener) {
    say("error " + std::to_string(listener.error().code()) + " " + listener.error().description());
    return 1;
  }
  if (arguments.size() > 1) {
    const auto most = static_cast<rlim_t>(std::stoul(arguments[1]));
    const rlimit limit{most, most};
    if (::setrlimit(RLIMIT_NOFILE, &limit) != 0) return 3;
  }
  (*listener)->setDelegate(&delegate);
  (*listener)->resume();
  say("ready");
  std::string line;
  while (std::getline(std::cin, line)) {
  }
  return 0;
}

std::string outcomeOf(Process& process, ipc::Connection& connection, const std::string& text) {
  const auto outcome = std::make_shared<std::string>("no outcome");
  const auto done = process.dispatch->newSemaphore(0);
  ipc::Invocation invocation;
  invocation.operation = TalkingObject::kEcho;
  invocation.arguments = {Value(text)};
  connection.sendWithReply(
      std::move(invocation),
      [=](Array values) {
        *outcome = "reply " + std::string(values[0].text());
        done->signal();
      },
      [=](const Error& error) {
        *outcome = "error " + std::to_string(error.code());
        done->signal();
      });
  done->waitFor(kDeadline);
  return *outcome;
}

std::shared_ptr<ipc::Connection> connect(Process& process) {
  auto connection = process.service.newConnection(kServiceName);
  if (!connection) ::_exit(3);
  (*connection)->resume();
  return *connection;
}

int call(const std::vector<std::string>& arguments) {
  Process process(arguments[0]);
  const auto connection = connect(process);
  say(outcomeOf(process, *connection, arguments.at(1)));
  return 0;
}

int runChild(Process& parents, std::shared_ptr<ipc::Connection> inherited, const std::string& root) {
  inherited->send({}, [](const Error&) { ::_exit(4); });
  inherited->invalidate();
  inherited.reset();
  if (parents.service.newConnection(kServiceName)) return 5;
  Process process(root);
  const auto connection = connect(process);
  say("child " + outcomeOf(process, *connection, "of my own"));
  return 0;
}

int forkAndGoOn(const std::vector<std::string>& arguments) {
  auto process = std::make_unique<Process>(arguments[0]);
  auto connection = connect(*process);
  say("before " + outcomeOf(*process, *connection, "one"));
  const pid_t child = ::fork();
  if (child == 0) {
    const int status = runChild(*process, std::move(connection), arguments[0]);
    process->service.~SocketService();  // as a library that is unloaded would; the rest is leaked
    ::_exit(status);
  }
  int status = 0;
  ::waitpid(child, &status, 0);
  say("child status " + std::to_string(WIFEXITED(status) ? WEXITSTATUS(status) : -1));
  say("parent " + outcomeOf(*process, *connection, "two"));
  return 0;
}

int run(const std::vector<std::string>& arguments) {
  if (arguments.size() < 2) return 2;
  const std::vector<std::string> rest(arguments.begin() + 1, arguments.end());
  if (arguments[0] == "serve") return serve(rest);
  if (arguments[0] == "call") return call(rest);
  if (arguments[0] == "fork") return forkAndGoOn(rest);
  return 2;
}

}  // namespace
}  // namespace telvane::testing

int main(int count, char** arguments) {
  return telvane::testing::run(std::vector<std::string>(arguments + 1, arguments + count));
}
