#pragma once

#include <map>
#include <string>
#include <utility>

#include "platform/DeviceAnswers.h"

namespace telvane::testing {

// A device whose answers the test gives. To be changed before anything asks, as a device's answers do not change.
class FixedDeviceAnswers final : public DeviceAnswers {
 public:
  FixedDeviceAnswers() = default;
  FixedDeviceAnswers(std::initializer_list<std::pair<const std::string, String>> answers) : _answers(answers) {}

  void set(std::string_view key, String answer) { _answers.insert_or_assign(std::string(key), std::move(answer)); }
  void remove(std::string_view key) { _answers.erase(std::string(key)); }
  std::optional<String> answer(const Key& key) const override {
    const auto found = _answers.find(std::string(key.view()));
    if (found == _answers.end()) return std::nullopt;
    return found->second;
  }

 private:
  std::map<std::string, String> _answers;
};

}  // namespace telvane::testing
