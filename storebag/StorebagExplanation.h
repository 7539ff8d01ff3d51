#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "backends/TelvaneBackend.h"
#include "foundation/Value.h"
#include "platform/Platform.h"
#include "platform/log/KeptLog.h"

// What a device would make of a storebag, and why: the bag goes the road that it goes in the daemon, from its macros to
// the states of its backends, and each step is written down.
namespace telvane {

// One step of a backend's decision; the client entry that it was about, if it was about one.
struct GateStep {
  std::optional<size_t> entry;
  GateAnswer answer;
};

struct BackendExplanation {
  String name;
  Value profile;        // with its macros expanded
  bool isMade = false;  // whether the factory makes a backend of the name and its profile; what follows is of one
  uint32_t state = 0;   // a TelvaneBackendState
  bool batchesEvents = false;
  // Where posts of ordinary and of real-time events really go; absent when the decision came to no URL.
  std::optional<std::string> postAddress;
  std::optional<std::string> realtimePostAddress;
  std::vector<GateStep> steps;
  std::vector<KeptLog::Line> logLines;  // what the daemon would write
};

struct StorebagExplanation {
  String frameworkVersion;
  bool isInternalBuild = false;
  Value version;                             // of the bag; absent when it has none
  std::vector<std::string_view> sections;    // the environments that the bag has sections for
  std::string_view environment;              // the one that the device asks for
  std::string_view section;                  // the one that it gets; empty when there is none
  Value releaseTimeout;                      // as the bag has it; absent when it has none
  Dictionary macros;                         // what is put in the place of each name
  std::vector<String> usedMacros;            // names in the section, in their order, each once
  std::vector<String> undefinedMacros;       // texts of the section that read as names and are none
  std::vector<BackendExplanation> backends;  // one for each entry of the section, in its order
  std::vector<KeptLog::Line> logLines;       // what the daemon would write before it makes backends
};

// Explains an inner bag, as its author wrote it, for a session with this session info and user info (absent for none).
// REQUIRES: log is the platform's log.
StorebagExplanation explainStorebag(Platform& platform, KeptLog& log, const Dictionary& bag,
                                    const Dictionary& sessionInfo, const Value& userInfo);

}  // namespace telvane
