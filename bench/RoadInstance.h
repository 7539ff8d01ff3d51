#pragma once

#include <sys/types.h>

#include <memory>
#include <string>
#include <vector>

#include "tests/support/ScratchFolder.h"
#include "tests/support/TestCertificates.h"

namespace telvane::bench {

// A child process whose end is this object's end.
class Child {
 public:
  // Starts a program with these arguments and environment; standard output goes to the file.
  Child(const std::vector<std::string>& arguments, const std::vector<std::string>& environment,
        const std::string& outputFile);
  ~Child();
  Child(const Child&) = delete;
  Child& operator=(const Child&) = delete;
  pid_t pid() const noexcept { return _pid; }
  // Waits for the end and returns the exit status, -1 after a signal.
  int wait();
  void terminate();

 private:
  pid_t _pid = -1;
};

// A scratch root with keys, certificate, signed bag and grants, a collector, and a daemon on it.
class RoadInstance {
 public:
  // programs: the folder with the programs. Throws std::runtime_error with the reason when something does not start.
  RoadInstance(std::string programs, const std::string& daemonLogLevel);
  ~RoadInstance();

  pid_t daemonPID() const noexcept { return _daemon->pid(); }
  std::string collectorURL(const std::string& path) const { return "https://" + _collectorAddress + path; }
  const std::string& authorityFile() const noexcept { return _certificates.authorityFile(); }
  // What the collector counted so far: a number of its /statistics.
  uint64_t collected(const std::string& name) const;
  // Runs a program of ours against this instance and returns what it printed.
  std::string run(const std::string& program, const std::vector<std::string>& arguments) const;

 private:
  std::vector<std::string> environment() const;
  void writeConfiguration();
  void startCollector();
  void startDaemon(const std::string& logLevel);

  const std::string _programs;
  testing::ScratchFolder _scratch;
  testing::TestCertificates _certificates;
  std::string _collectorAddress;
  std::unique_ptr<Child> _collector;
  std::unique_ptr<Child> _daemon;
};

}  // namespace telvane::bench
