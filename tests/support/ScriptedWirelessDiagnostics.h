#pragma once

#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <vector>

#include "platform/WirelessDiagnostics.h"

namespace telvane::testing {

// A system with the bundles that the test puts there, and keeps what their adaptors are given; without any at first.
// Safe from any thread.
class ScriptedWirelessDiagnostics final : public WirelessDiagnostics {
 public:
  struct Message {
    std::string adaptor;  // its description: "<class of path>"
    uint16_t method = 0;
    uint16_t respCode = 0;
    Dictionary dict;
  };

  ScriptedWirelessDiagnostics();
  ~ScriptedWirelessDiagnostics() override;

  // There is a bundle at the path from now on, with no class but those that are put there.
  void putBundle(const std::string& path);
  // Puts a class into the bundle, which is made if need be; its instances respond to these selectors.
  void putClass(const std::string& path, const std::string& className,
                std::set<std::string> selectors = {"sendMessageWithMethod:respCode:dict:"});
  // Takes the bundle away; those that were opened before stay.
  void removeBundle(const std::string& path);

  std::vector<Message> messages() const;
  // The paths asked for, each time.
  std::vector<std::string> openedPaths() const;
  // What was made and has not been let go of yet.
  size_t liveBundles() const;
  size_t liveAdaptors() const;

  std::unique_ptr<WirelessDiagnosticsBundle> openBundleAtPath(const std::string& path) override;

 private:
  struct State;
  class Bundle;
  class Adaptor;

  const std::shared_ptr<State> _state;
};

}  // namespace telvane::testing
