#include "util/ProcessContext.h"

namespace telvane {
namespace {

constexpr uint32_t kMostLingeringDashboards = 64;
constexpr std::string_view kInternalReleaseType = "Internal";
constexpr std::string_view kFallbackFrameworkVersion = "8.0";

bool askIsInternalBuild(const DeviceAnswers& deviceAnswers) {
  const auto releaseType = deviceAnswers.answer(DeviceAnswers::kReleaseType);
  return releaseType.has_value() && *releaseType == kInternalReleaseType;
}

}  // namespace

ProcessContext::ProcessContext(Platform& platform)
    : _platform(platform),
      _isInternalBuild(askIsInternalBuild(platform.deviceAnswers)),
      _processInstanceIdentifier(platform.random.newUUID().string()),
      _clientFrameworkVersion(platform.clientBundle.version().value_or(String::fromStatic(kFallbackFrameworkVersion))),
      _runningUploads(std::make_unique<RunningUploads>()),
      _lingeringDashboards(std::make_unique<Places>(kMostLingeringDashboards)) {}

}  // namespace telvane
