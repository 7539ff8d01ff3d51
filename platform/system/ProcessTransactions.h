#pragma once

#include <chrono>
#include <cstdint>
#include <memory>

#include "platform/Clock.h"
#include "platform/Dispatch.h"
#include "platform/Transactions.h"

namespace telvane {

// Counts the transactions of this process and tells when it has none. Made by the entry point; safe from any thread.
// One delayed job is under way at most, however often the count falls to nothing.
class ProcessTransactions final : public Transactions {
 public:
  // The clock outlives this object.
  explicit ProcessTransactions(const Clock& clock);
  ~ProcessTransactions() override;

  void begin() override;
  void end() override;
  uint64_t count() const;
  // Runs the handler on the queue, once, when no transaction has been held for this time, from this call on. Another
  // call replaces the handler and starts anew.
  void whenIdleFor(std::chrono::nanoseconds time, std::shared_ptr<SerialQueue> queue, Job handler);
  // Runs the handler on the queue, once, when no transaction is held: soon when that is so already. Another one may be
  // held again when it runs.
  void whenNoneHeld(std::shared_ptr<SerialQueue> queue, Job handler);

 private:
  class State;
  const std::shared_ptr<State> _state;  // shared with delayed jobs, which may outlive this object
};

}  // namespace telvane
