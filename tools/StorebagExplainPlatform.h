#pragma once

#include <memory>

#include "platform/Platform.h"
#include "platform/log/KeptLog.h"
#include "tools/StorebagExplainReport.h"

namespace telvane {

// The device of a case as the Platform that the daemon's code asks: place, consent, settings, device, chance and client
// bundle answer what the case says; everything else is this system's own. Nothing is begun: no settings are written, no
// socket is opened, no timer runs, no code of the device's is loaded.
class StorebagExplainPlatform {
 public:
  explicit StorebagExplainPlatform(const StorebagExplainCase& situation);
  StorebagExplainPlatform(const StorebagExplainPlatform&) = delete;
  StorebagExplainPlatform& operator=(const StorebagExplainPlatform&) = delete;
  ~StorebagExplainPlatform();

  Platform& platform() noexcept;
  // The platform's log.
  KeptLog& log() noexcept;

 private:
  struct Parts;
  const std::unique_ptr<Parts> _parts;
};

}  // namespace telvane
