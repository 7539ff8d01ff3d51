#include "tests/platform/ipc/PeerProcess.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <stdexcept>
#include <utility>

namespace telvane::testing {

namespace {
constexpr int kDeadlineMilliseconds = 30'000;
}

std::string PeerProcess::program() { return std::string(TELVANE_PROGRAM_DIR) + "/telvane_ipc_peer"; }

PeerProcess::PeerProcess(std::vector<std::string> arguments, int passed) {
  int input[2];
  int output[2];
  if (::pipe2(input, O_CLOEXEC) != 0 || ::pipe2(output, O_CLOEXEC) != 0) throw std::runtime_error("no pipe");
  // The service manager names the process that its descriptors are meant for, which a shell can do before it becomes
  // it.
  const std::string script = passed >= 0 ? "LISTEN_PID=$$ LISTEN_FDS=1 exec \"$0\" \"$@\"" : "exec \"$0\" \"$@\"";
  std::vector<std::string> words = {"sh", "-c", script, program()};
  words.insert(words.end(), arguments.begin(), arguments.end());
  std::vector<char*> pointers;
  for (auto& word : words) pointers.push_back(word.data());
  pointers.push_back(nullptr);
  _process = ::fork();
  if (_process == 0) {
    ::dup2(input[0], 0);
    ::dup2(output[1], 1);
    if (passed >= 0) {
      ::dup2(passed, 3);
      ::fcntl(3, F_SETFD, 0);
    }
    ::execv("/bin/sh", pointers.data());
    ::_exit(127);
  }
  ::close(input[0]);
  ::close(output[1]);
  _input = ipc::Descriptor(input[1]);
  _output = ipc::Descriptor(output[0]);
}

PeerProcess::~PeerProcess() {
  kill();
  wait();
}

bool PeerProcess::fill() {
  pollfd ready{_output.get(), POLLIN, 0};
  if (::poll(&ready, 1, kDeadlineMilliseconds) != 1) return false;
  char buffer[4096];
  const auto size = ::read(_output.get(), buffer, sizeof buffer);
  if (size <= 0) return false;
  _read.append(buffer, static_cast<size_t>(size));
  return true;
}

std::string PeerProcess::readLine() {
  for (;;) {
    const auto end = _read.find('\n');
    if (end != std::string::npos) {
      std::string line = _read.substr(0, end);
      _read.erase(0, end + 1);
      return line;
    }
    if (!fill()) return std::exchange(_read, {});
  }
}

std::string PeerProcess::readAll() {
  while (fill()) {
  }
  return std::exchange(_read, {});
}

void PeerProcess::writeLine(const std::string& line) {
  const std::string bytes = line + "\n";
  if (::write(_input.get(), bytes.data(), bytes.size()) != static_cast<ssize_t>(bytes.size())) {
    throw std::runtime_error("the peer process does not read");
  }
}

void PeerProcess::kill() {
  if (_process > 0) ::kill(_process, SIGKILL);
}

int PeerProcess::wait() {
  if (_process <= 0) return -1;
  int status = 0;
  ::waitpid(std::exchange(_process, -1), &status, 0);
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

}  // namespace telvane::testing
