#pragma once

#include <chrono>
#include <memory>

#include "foundation/Key.h"
#include "platform/Clock.h"
#include "platform/Dispatch.h"
#include "platform/Log.h"
#include "platform/Random.h"
#include "platform/UserDefaults.h"
#include "platform/ipc/Service.h"

namespace telvane {

// The real seams of a library inside a process that is not ours: only those that a client needs, so that the host loads
// no more, and none that is felt before it is used: no thread, no signal handling, nothing printed. Log lines go to the
// journal, if the system has one, and nowhere otherwise; of them, the library writes errors only unless the number
// "clientLogLevel" of the defaults suite asks for more (1 default, 2 info).
//
// Made by the library on first use. In a forked child it must neither be used nor destroyed: the child leaks it.
class LibraryPlatform {
 public:
  // defaultsSuite: where the user's wishes about the log stand.
  explicit LibraryPlatform(Key defaultsSuite);
  // REQUIRES: nothing that it handed out is used any more.
  ~LibraryPlatform();

  Clock& clock() noexcept;
  Dispatch& dispatch() noexcept;
  Log& log() noexcept;
  Random& random() noexcept;
  UserDefaults& userDefaults() noexcept;
  ipc::Service& localService() noexcept;

  // Waits until the connections that were let go have delivered what they had, at most this long; every connection is
  // over then, and none can be made any more. Called once, when the process ends.
  void endConnections(std::chrono::milliseconds patience);

 private:
  struct Parts;
  const std::unique_ptr<Parts> _parts;
};

}  // namespace telvane
