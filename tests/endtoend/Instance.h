#pragma once

#include <sys/types.h>

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "foundation/Value.h"
#include "platform/Crypto.h"
#include "tests/support/ChildProcess.h"
#include "tests/support/ScratchFolder.h"
#include "tests/support/TestCertificates.h"

namespace telvane::testing {

// A whole Telvane in a scratch root: real daemon, real collector over TLS on loopback, real client processes. What the
// operator would write (keys, bags, grants, settings) is written here.
class Instance {
 public:
  Instance();
  // Aborts the program when a sanitizer has reported something of one of the processes: a report alone ends none of
  // them, and what a test waits for may come all the same.
  ~Instance();

  // Configuration; to be given before the process that reads it starts.
  // Signs the bag and publishes it under the name.
  void givenStorebag(const std::string& name, const Dictionary& bag);
  // Publishes these bytes as they are.
  void givenStorebagFile(const std::string& name, std::string_view bytes);
  std::string signedEnvelope(const Dictionary& bag) const;
  // Where the daemon looks for storebags; the collector's by default.
  void givenStorebagServer(const std::string& url);
  void givenConsent(bool isGiven);
  // Writes a file of the instance: "root/…" below TELVANE_ROOT, "home/…" in the user's home, "bundle/…".
  void givenFile(const std::string& path, std::string_view content) { _scratch.write(path, content); }
  std::string path(const std::string& name) const { return _scratch.at(name); }
  // A grant for a program of ours, by its name; without it, it is refused. The event sender has one from the start.
  void grant(const std::string& programName);
  // What a server of the test's own shows its clients, and what these trust.
  TestCertificates::Server serverCertificate() { return _certificates.valid(); }
  const std::string& authorityFile() const noexcept { return _certificates.authorityFile(); }

  // Processes.
  // record: what the collector does with events; it writes them to a file by default.
  void startCollector() { startCollector({"--events", path("events.jsonl")}); }
  void startCollector(const std::vector<std::string>& record);
  // Returns when the daemon serves, or has ended.
  void startDaemon(const std::vector<std::string>& options = {"--log-level", "info"});
  // The same, but returns at once. The daemon before it is ended by then.
  void launchDaemon(const std::vector<std::string>& options);
  ChildProcess& daemon() { return *_daemon; }
  // Starts another daemon on the same root, which is not waited for.
  std::unique_ptr<ChildProcess> startSecondDaemon();
  // Runs the event sender to its end and returns what it printed. See EventSender.cpp for its arguments.
  std::string sendEvents(const std::vector<std::string>& arguments);
  // Starts it; it ends when its input is closed. Its output goes to the file "sender.out".
  std::unique_ptr<ChildProcess> startSender(const std::vector<std::string>& arguments);

  // Starts any program of ours in this instance; its output goes to the files "<outputName>.out" and ".err".
  std::unique_ptr<ChildProcess> startProgram(const std::string& programName, const std::vector<std::string>& arguments,
                                             const std::string& outputName);

  // The same as another user, in no other group than its own. REQUIRES: root. The folders above the instance let
  // everybody through from then on.
  std::unique_ptr<ChildProcess> startProgramAs(uid_t user, const std::string& programName,
                                               const std::vector<std::string>& arguments,
                                               const std::string& outputName);
  // Starts the daemon as another user, to whom the instance's folders are given, and returns when it serves.
  void startDaemonAs(uid_t user, const std::vector<std::string>& options = {"--log-level", "info"});

  std::string collectorURL(const std::string& path) const { return "https://" + _collectorAddress + path; }
  // What has arrived so far: one line per event, as the collector writes it.
  std::vector<Dictionary> arrived() const;
  // The events that have arrived with this category.
  std::vector<Dictionary> arrivedWithCategory(int64_t category) const;
  std::string daemonLog() const { return _scratch.read("daemon.err"); }
  std::string read(const std::string& name) const { return _scratch.read(name); }
  bool daemonLogHas(std::string_view part) const { return daemonLog().find(part) != std::string::npos; }
  std::string socketPath() const { return path("root/run/telvane/com.corvex.telvaned.socket"); }

 private:
  std::vector<std::string> environment() const;
  void waitForDaemon(size_t logSizeBefore);
  void writeBundle();
  // What the processes have written that holds a report; empty when there is none.
  std::string sanitizerReports() const;

  ScratchFolder _scratch;
  TestCertificates _certificates;
  const crypto::PrivateKey _key;
  std::string _collectorAddress;
  std::unique_ptr<ChildProcess> _collector;
  std::unique_ptr<ChildProcess> _daemon;
};

// Waits until the condition holds, for at most 40 s; returns whether it does.
bool eventually(const std::function<bool()>& condition);

// A bag with one HTTPS backend "splunk" that takes every client in the US and posts to the URL, consent or not.
Dictionary openBag(const std::string& postURL);

}  // namespace telvane::testing
