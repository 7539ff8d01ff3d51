#pragma once

#include <atomic>

#include "platform/Consent.h"

namespace telvane::testing {

// A user whose mind the test makes up. Safe from any thread.
class FixedConsent final : public Consent {
 public:
  explicit FixedConsent(bool isAllowed = true) : _isAllowed(isAllowed) {}

  void set(bool isAllowed) { _isAllowed = isAllowed; }
  bool isSubmissionAllowed() const override { return _isAllowed; }

 private:
  std::atomic<bool> _isAllowed;
};

}  // namespace telvane::testing
