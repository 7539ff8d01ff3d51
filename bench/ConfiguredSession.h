#pragma once

#include <telvane/Telvane.h>

#include <memory>

namespace telvane::bench {

// Opens a session of the client "bench" and this service, and waits for its configuration. Throws std::runtime_error
// when it cannot be opened or no backend is enabled for it.
std::shared_ptr<Telvane> newConfiguredSession(const Dictionary& sessionInfo, const char* serviceName);

}  // namespace telvane::bench
