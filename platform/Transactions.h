#pragma once

namespace telvane {

// Process-level transactions with the service manager: while one is open the process is not ended for being idle.
// A plain count; safe from any thread.
class Transactions {
 public:
  virtual ~Transactions() = default;
  virtual void begin() = 0;
  // An end without a begin is ignored.
  virtual void end() = 0;
};

}  // namespace telvane
