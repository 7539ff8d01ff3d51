#include "interfaces/BackendKind.h"

#include "interfaces/BackendNames.h"

namespace telvane {

BackendKind backendKindForName(std::string_view name) noexcept {
  if (name == kTelvaneBackendDashboard.view()) return BackendKind::Dashboard;
  if (name == kTelvaneBackendUploadServer.view()) return BackendKind::UploadServer;
  if (name.find(kTelvaneBackendHTTPPost.view()) != std::string_view::npos) return BackendKind::HTTPSPost;
  if (name == kTelvaneBackendHTTPPost2.view()) return BackendKind::HTTPSPost;
  if (name == kTelvaneBackendWattbook.view()) return BackendKind::Wattbook;
  if (name == kTelvaneBackendQRS.view()) return BackendKind::HTTPSPost;
  if (name == kTelvaneBackendVDR.view()) return BackendKind::VDR;
  return BackendKind::Unknown;
}

}  // namespace telvane
