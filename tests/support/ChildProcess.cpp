#include "tests/support/ChildProcess.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <stdexcept>
#include <thread>
#include <utility>

namespace telvane::testing {
namespace {

constexpr auto kStep = std::chrono::milliseconds(2);

std::vector<char*> pointers(const std::vector<std::string>& texts) {
  std::vector<char*> result;
  result.reserve(texts.size() + 1);
  for (const std::string& text : texts) result.push_back(const_cast<char*>(text.c_str()));
  result.push_back(nullptr);
  return result;
}

int openForAppending(const std::string& path) {
  return open(path.empty() ? "/dev/null" : path.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
}

}  // namespace

ChildProcess::ChildProcess(const std::vector<std::string>& arguments, const std::vector<std::string>& environment,
                           const Files& files) {
  // Everything is prepared before the fork: between it and exec only system calls are allowed.
  const std::vector<char*> argumentPointers = pointers(arguments);
  const std::vector<char*> environmentPointers = pointers(environment);
  int input[2];
  if (pipe2(input, O_CLOEXEC) != 0) throw std::runtime_error("no pipe for a child process");
  const int output = openForAppending(files.output);
  const int errors = openForAppending(files.errors);
  _pid = fork();
  if (_pid == 0) {
    prctl(PR_SET_PDEATHSIG, SIGKILL);
    dup2(input[0], STDIN_FILENO);
    dup2(output, STDOUT_FILENO);
    dup2(errors, STDERR_FILENO);
    execve(argumentPointers[0], argumentPointers.data(), environmentPointers.data());
    _exit(127);
  }
  close(input[0]);
  close(output);
  close(errors);
  _input = input[1];
  if (_pid < 0) throw std::runtime_error("cannot start " + arguments[0]);
}

ChildProcess::~ChildProcess() {
  if (isRunning()) signal(SIGKILL);
  wait();
}

void ChildProcess::signal(int number) {
  if (_pid > 0) kill(_pid, number);
}

void ChildProcess::stop() {
  signal(SIGSTOP);
  siginfo_t info{};
  while (_pid > 0 && waitid(P_PID, static_cast<id_t>(_pid), &info, WSTOPPED | WEXITED | WNOWAIT) != 0 &&
         errno == EINTR) {
  }
}

void ChildProcess::writeLine() {
  if (_input < 0 || !isRunning()) return;
  if (write(_input, "\n", 1) != 1) throw std::runtime_error("a child process takes no input");
}

void ChildProcess::closeInput() {
  if (_input >= 0) close(std::exchange(_input, -1));
}

bool ChildProcess::isRunning() {
  if (_pid <= 0) return false;
  int status = 0;
  if (waitpid(_pid, &status, WNOHANG) == 0) return true;
  _status = WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
  _pid = -1;
  return false;
}

int ChildProcess::wait(std::chrono::milliseconds patience) {
  closeInput();
  const auto deadline = std::chrono::steady_clock::now() + patience;
  while (isRunning()) {
    if (std::chrono::steady_clock::now() > deadline) signal(SIGKILL);
    std::this_thread::sleep_for(kStep);
  }
  return _status;
}

}  // namespace telvane::testing
