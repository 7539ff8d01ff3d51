#pragma once

#include <deque>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/FileSystem.h"
#include "platform/FlowGate.h"
#include "platform/URLSession.h"
#include "tests/support/NetworkAnswer.h"
#include "tests/support/SimulatedScheduler.h"

namespace telvane::testing {

class ScriptedURLSession;
class ScriptedURLSessionTask;

// One resumed task, as the network saw it.
struct RecordedRequest {
  std::string process;
  std::string sessionDescription;
  std::string taskDescription;
  URLRequest request;  // of an upload, with the file's bytes as the body
  URLSessionConfiguration configuration;
  bool isUpload = false;  // the body is a file
  SimulatedScheduler::Time resumedAt;
  // When it left, later than resumedAt if it waited for connectivity; nothing if it has not left.
  std::optional<SimulatedScheduler::Time> leftAt;
  // How it ended; nothing while it runs.
  std::optional<SimulatedScheduler::Time> completedAt;
  std::optional<Error> error;
};

// The network of a simulated world. Requests are answered by the script: the newest rule whose text the URL begins with
// ("https://host/path"), or contains ("host"). What no rule is for cannot find its host.
//
// Answers come at once in virtual time unless they say otherwise. A running transfer that nothing comes to for 60 s
// times out; a request's own time-out counts from resume. While there is no connectivity, tasks of sessions that wait
// for it wait (up to 7 days), others fail at once.
class ScriptedNetwork {
 public:
  using Script = std::function<NetworkAnswer(const URLRequest& request)>;
  static constexpr std::chrono::seconds kIdleTimeout{60};
  static constexpr std::chrono::hours kResourceTimeout{7 * 24};

  explicit ScriptedNetwork(SimulatedScheduler& scheduler) : _scheduler(scheduler) {}

  // Answers every request to such a URL.
  void answer(std::string url, NetworkAnswer answer);
  void answerWith(std::string url, Script script);
  // Answers the next request to such a URL, in the order of the calls, before any standing rule does.
  void answerOnce(std::string url, NetworkAnswer answer);

  // From here on there is no network. Running transfers go on; see breakConnections().
  void loseConnectivity() { _isConnected = false; }
  // Tasks that wait for it leave now.
  void restoreConnectivity();
  // Ends every transfer that has left with NetworkConnectionLost.
  void breakConnections();

  // In the order in which they were resumed.
  const std::deque<RecordedRequest>& requests() const noexcept { return _requests; }
  std::vector<RecordedRequest> requestsTo(std::string_view url) const;
  size_t countTo(std::string_view url) const { return requestsTo(url).size(); }

  // The network as one process sees it. gate may be null; it and files outlive the provider's sessions.
  std::unique_ptr<URLSessionProvider> newProvider(std::string processName, SimulatedScheduler::ProcessID process,
                                                  const FileSystem& files, FlowGate* gate);
  // Lets go of what the process had under way; nobody hears of it.
  void endProcess(SimulatedScheduler::ProcessID process);

 private:
  friend class ScriptedURLSession;
  friend class ScriptedURLSessionTask;
  struct Rule {
    std::string url;
    Script script;
    bool isOnce;
  };

  static bool applies(const std::string& rule, std::string_view url);
  NetworkAnswer answerFor(const URLRequest& request);
  RecordedRequest& record(RecordedRequest request);
  void remember(const std::shared_ptr<ScriptedURLSession>& session);
  std::vector<std::shared_ptr<ScriptedURLSession>> sessions() const;
  std::vector<std::shared_ptr<ScriptedURLSessionTask>> runningTasks() const;

  SimulatedScheduler& _scheduler;
  std::vector<Rule> _rules;
  bool _isConnected = true;
  std::deque<RecordedRequest> _requests;  // stays in place while it grows: tasks note their end in it
  std::vector<std::weak_ptr<ScriptedURLSession>> _sessions;
};

}  // namespace telvane::testing
