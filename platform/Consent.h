#pragma once

namespace telvane {

// The user's consent to the submission of diagnostics and usage data. Safe from any thread.
class Consent {
 public:
  virtual ~Consent() = default;
  // Whether the user consents; no answer means no.
  virtual bool isSubmissionAllowed() const = 0;
};

}  // namespace telvane
