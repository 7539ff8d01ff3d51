#pragma once

#include <memory>

#include "platform/FlowGate.h"
#include "platform/Platform.h"
#include "platform/system/ProcessTransactions.h"

namespace telvane {

// The real seams of a program: threads, files, sockets, the network, as the environment directs them. Made by main,
// which made the log, and let go of last but for the log. Makes no thread and opens nothing before it is used. For
// programs only: a library inside a host loads less and stays unseen.
//
// Its destructor waits for jobs that have been given to queues, and for what was sent on local connections; a program
// that cannot wait for its jobs ends without it.
class SystemPlatform {
 public:
  // Reads the environment once. REQUIRES: the log outlives this object.
  explicit SystemPlatform(Log& log);
  SystemPlatform(const SystemPlatform&) = delete;
  SystemPlatform& operator=(const SystemPlatform&) = delete;
  ~SystemPlatform();

  const Platform& platform() const noexcept;
  // The transactions of the platform, with what the entry point wants to know of them.
  ProcessTransactions& transactions() noexcept;
  // Closed while too many bytes wait for the network.
  FlowGate& flowGate() noexcept;

 private:
  struct Parts;
  const std::unique_ptr<Parts> _parts;
};

}  // namespace telvane
