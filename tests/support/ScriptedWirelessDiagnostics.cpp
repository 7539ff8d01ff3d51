#include "tests/support/ScriptedWirelessDiagnostics.h"

#include <map>
#include <utility>

namespace telvane::testing {

using Selectors = std::set<std::string>;

struct ScriptedWirelessDiagnostics::State {
  mutable std::mutex mutex;
  std::map<std::string, std::map<std::string, Selectors>> classesByBundle;
  std::vector<Message> messages;
  std::vector<std::string> openedPaths;
  size_t liveBundles = 0;
  size_t liveAdaptors = 0;
};

class ScriptedWirelessDiagnostics::Adaptor final : public WirelessDiagnosticsAdaptor {
 public:
  Adaptor(std::shared_ptr<State> state, std::string description, Selectors selectors)
      : _state(std::move(state)), _description(std::move(description)), _selectors(std::move(selectors)) {
    const std::lock_guard lock(_state->mutex);
    ++_state->liveAdaptors;
  }
  ~Adaptor() override {
    const std::lock_guard lock(_state->mutex);
    --_state->liveAdaptors;
  }
  std::string description() const override { return _description; }
  bool respondsTo(std::string_view selector) const override { return _selectors.contains(std::string(selector)); }
  void sendMessageWithMethod(uint16_t method, uint16_t respCode, const Dictionary& dict) override {
    const std::lock_guard lock(_state->mutex);
    _state->messages.push_back({_description, method, respCode, dict});
  }

 private:
  const std::shared_ptr<State> _state;
  const std::string _description;
  const Selectors _selectors;
};

class ScriptedWirelessDiagnostics::Bundle final : public WirelessDiagnosticsBundle {
 public:
  Bundle(std::shared_ptr<State> state, std::string path) : _state(std::move(state)), _path(std::move(path)) {
    const std::lock_guard lock(_state->mutex);
    ++_state->liveBundles;
  }
  ~Bundle() override {
    const std::lock_guard lock(_state->mutex);
    --_state->liveBundles;
  }
  std::unique_ptr<WirelessDiagnosticsAdaptor> newInstanceOfClass(std::string_view className) override {
    const std::string name(className);
    Selectors selectors;
    {
      const std::lock_guard lock(_state->mutex);
      const auto& classes = _state->classesByBundle[_path];
      const auto found = classes.find(name);
      if (found == classes.end()) return nullptr;
      selectors = found->second;
    }
    return std::make_unique<Adaptor>(_state, "<" + name + " of " + _path + ">", std::move(selectors));
  }

 private:
  const std::shared_ptr<State> _state;
  const std::string _path;
};

ScriptedWirelessDiagnostics::ScriptedWirelessDiagnostics() : _state(std::make_shared<State>()) {}

ScriptedWirelessDiagnostics::~ScriptedWirelessDiagnostics() = default;

void ScriptedWirelessDiagnostics::putBundle(const std::string& path) {
  const std::lock_guard lock(_state->mutex);
  _state->classesByBundle.try_emplace(path);
}

void ScriptedWirelessDiagnostics::putClass(const std::string& path, const std::string& className,
                                           std::set<std::string> selectors) {
  const std::lock_guard lock(_state->mutex);
  _state->classesByBundle[path].insert_or_assign(className, std::move(selectors));
}

void ScriptedWirelessDiagnostics::removeBundle(const std::string& path) {
  const std::lock_guard lock(_state->mutex);
  _state->classesByBundle.erase(path);
}

std::vector<ScriptedWirelessDiagnostics::Message> ScriptedWirelessDiagnostics::messages() const {
  const std::lock_guard lock(_state->mutex);
  return _state->messages;
}

std::vector<std::string> ScriptedWirelessDiagnostics::openedPaths() const {
  const std::lock_guard lock(_state->mutex);
  return _state->openedPaths;
}

size_t ScriptedWirelessDiagnostics::liveBundles() const {
  const std::lock_guard lock(_state->mutex);
  return _state->liveBundles;
}

size_t ScriptedWirelessDiagnostics::liveAdaptors() const {
  const std::lock_guard lock(_state->mutex);
  return _state->liveAdaptors;
}

std::unique_ptr<WirelessDiagnosticsBundle> ScriptedWirelessDiagnostics::openBundleAtPath(const std::string& path) {
  {
    const std::lock_guard lock(_state->mutex);
    _state->openedPaths.push_back(path);
    if (!_state->classesByBundle.contains(path)) return nullptr;
  }
  return std::make_unique<Bundle>(_state, path);
}

}  // namespace telvane::testing
