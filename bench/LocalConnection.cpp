// What a call costs over the local connection: a client process sends events of 10 fields as fast as it can, a daemon
// process answers each. Prints calls per second and the processor time of both processes per call.
//
//   telvane-bench-ipc [CALLS]

#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <string>

#include "platform/dispatch/ThreadedDispatch.h"
#include "platform/ipc/Entitlements.h"
#include "platform/ipc/SocketService.h"
#include "platform/log/NullLog.h"
#include "platform/system/PosixFileSystem.h"

namespace telvane {
namespace {

constexpr const char* kServiceName = "com.corvex.benchmark";

// Answers each call with nothing, and counts.
class Answering final : public ipc::ExportedObject {
 public:
  void invoke(ipc::Invocation invocation, ipc::ReplyBlock reply) override {
    if (invocation.arguments.size() != 1) std::abort();
    if (reply) reply({Value(true)});
  }
};

class Accepting final : public ipc::ListenerDelegate {
 public:
  bool listener(ipc::Listener&, std::shared_ptr<ipc::Connection> connection) override {
    connection->setExportedObject(std::make_shared<Answering>());
    connection->resume();
    return true;
  }
};

struct Process {
  explicit Process(const std::string& root)
      : files(Paths{root, root}), entitlements(files, log), service(files, dispatch, log, entitlements) {}

  NullLog log;
  ThreadedDispatch dispatch;
  PosixFileSystem files;
  ipc::Entitlements entitlements;
  ipc::SocketService service;
};

Value newEvent(int number) {
  Dictionary payload;
  payload.set(Key("identifier"), Value(number));
  payload.set(Key("action"), Value("button pressed"));
  payload.set(Key("screen"), Value("settings/general/about"));
  payload.set(Key("duration"), Value(0.125 * number));
  payload.set(Key("success"), Value(true));
  payload.set(Key("attempts"), Value(3));
  payload.set(Key("country"), Value("AT"));
  payload.set(Key("version"), Value("17.4.1 (21E236)"));
  payload.set(Key("bytes"), Value(int64_t{1} << 33));
  payload.set(Key("comment"), Value("a text of a few words, as they are"));
  Dictionary message;
  message.set(Key("ParametersCategory"), Value(12));
  message.set(Key("ParametersType"), Value(34));
  message.set(Key("ParametersPayload"), Value(payload));
  return Value(message);
}

double processorSeconds(int who) {
  rusage usage{};
  getrusage(who, &usage);
  const auto seconds = [](const timeval& time) {
    return static_cast<double>(time.tv_sec) + 1e-6 * static_cast<double>(time.tv_usec);
  };
  return seconds(usage.ru_utime) + seconds(usage.ru_stime);
}

int serve(const std::string& root, int ready, int end) {
  Process process(root);
  Accepting delegate;
  auto listener = process.service.newListener(kServiceName);
  if (!listener) return 1;
  (*listener)->setDelegate(&delegate);
  (*listener)->resume();
  char byte = 0;
  if (::write(ready, &byte, 1) != 1 || ::read(end, &byte, 1) < 0) return 1;
  return 0;
}

// Keeps some calls ahead of the answers; the waiting itself costs next to nothing per call.
void sendAll(Process& process, int count) {
  constexpr int kStride = 5'000;
  auto connection = *process.service.newConnection(kServiceName);
  connection->resume();
  const auto room = process.dispatch.newSemaphore(2);
  for (int i = 0; i < count; ++i) {
    if (i % kStride == 0) room->wait();
    const bool isLast = i % kStride == kStride - 1;
    ipc::Invocation invocation;
    invocation.operation = 5;
    invocation.arguments.append(newEvent(i));
    connection->sendWithReply(
        std::move(invocation),
        [room, isLast](const Array&) {
          if (isLast) room->signal();
        },
        [](const Error&) { std::abort(); });
  }
  for (int i = 0; i < 2; ++i) room->wait();
}

void sendOneByOne(Process& process, int count) {
  auto connection = *process.service.newConnection(kServiceName);
  connection->resume();
  const auto answered = process.dispatch.newSemaphore(0);
  for (int i = 0; i < count; ++i) {
    ipc::Invocation invocation;
    invocation.arguments.append(newEvent(i));
    connection->sendWithReply(
        std::move(invocation), [answered](const Array&) { answered->signal(); }, [](const Error&) { std::abort(); });
    answered->wait();
  }
}

double secondsFor(const auto& act) {
  const auto start = std::chrono::steady_clock::now();
  act();
  return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
}

int run(const std::string& root, int count) {
  int ready[2];
  int end[2];
  if (::pipe(ready) != 0 || ::pipe(end) != 0) return 1;
  const pid_t daemon = ::fork();
  if (daemon == 0) {
    ::close(end[1]);
    ::_exit(serve(root, ready[1], end[0]));
  }
  char byte = 0;
  if (::read(ready[0], &byte, 1) != 1) return 1;
  double making = processorSeconds(RUSAGE_SELF);
  for (int i = 0; i < count; ++i) newEvent(i);
  making = processorSeconds(RUSAGE_SELF) - making;
  double client = processorSeconds(RUSAGE_SELF);
  double seconds = 0;
  double alone = 0;
  constexpr int kAlone = 2000;
  {
    Process process(root);
    seconds = secondsFor([&] { sendAll(process, count); });
    client = processorSeconds(RUSAGE_SELF) - client;
    alone = secondsFor([&] { sendOneByOne(process, kAlone); });
  }
  ::close(end[1]);
  ::waitpid(daemon, nullptr, 0);
  const double server = processorSeconds(RUSAGE_CHILDREN);
  const double scale = 1e6 / count;
  std::printf(
      "%.0f calls/s; per call: client %.2f us (of which making the event %.2f), daemon %.2f us, both without "
      "making %.2f us; a call on its own takes %.1f us\n",
      count / seconds, client * scale, making * scale, server * scale, (client + server - making) * scale,
      1e6 * alone / kAlone);
  return 0;
}

}  // namespace
}  // namespace telvane

int main(int count, char** arguments) {
  char root[] = "/tmp/telvane-benchmark-XXXXXX";
  if (mkdtemp(root) == nullptr) return 1;
  const int status = telvane::run(root, count > 1 ? std::atoi(arguments[1]) / 5000 * 5000 : 200'000);
  const std::string removal = std::string("rm -rf ") + root;
  return std::system(removal.c_str()) == 0 ? status : 1;
}
