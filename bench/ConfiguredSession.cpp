#include "bench/ConfiguredSession.h"

#include <future>
#include <stdexcept>

namespace telvane::bench {

std::shared_ptr<Telvane> newConfiguredSession(const Dictionary& sessionInfo, const char* serviceName) {
  const Dictionary userInfo{{"_clientName", "bench"}, {"_serviceName", serviceName}};
  auto session = Telvane::initWithSessionInfo(sessionInfo, userInfo);
  if (session == nullptr) throw std::runtime_error("there is no session");
  auto configured = std::make_shared<std::promise<bool>>();
  std::future<bool> isEnabled = configured->get_future();
  session->startConfigurationWithCompletionHandler([configured = std::move(configured)](const Value& names) {
    configured->set_value(names.array() != nullptr && names.array()->size() > 0);
  });
  if (!isEnabled.get()) throw std::runtime_error("no backend is enabled");
  return session;
}

}  // namespace telvane::bench
