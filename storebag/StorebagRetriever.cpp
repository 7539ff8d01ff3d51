#include "storebag/StorebagRetriever.h"

#include <algorithm>
#include <cmath>

#include "interfaces/BackendNames.h"
#include "interfaces/ClientTypes.h"
#include "interfaces/DefaultsKeys.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"
#include "platform/PropertyList.h"
#include "storebag/StorebagMacros.h"
#include "storebag/StorebagSection.h"
#include "storebag/StorebagVerification.h"
#include "util/DataHelpers.h"

namespace telvane {
namespace {

constexpr int64_t kMaximumRefreshCycle = 86400;
constexpr auto kRequestTimeout = std::chrono::seconds(15);
constexpr uint32_t kHelperReleaseTimeout = 30;
constexpr int kStatusOK = 200;
constexpr char kHelperClientName[] = "storebag";
constexpr char kHelperServiceName[] = "shared";

}  // namespace

StorebagRetriever::StorebagRetriever(const ProcessContext& context, ConnectivityShared& shared)
    : _context(context), _shared(shared), _cache(context), _storebagLock(context.platform().dispatch.newMonitor()) {}

StorebagRetriever::~StorebagRetriever() {
  MonitorLock lock(*_storebagLock);
  if (_storebagConnectivityHelper != nullptr) _storebagConnectivityHelper->invalidate();
}

std::optional<std::string_view> StorebagRetriever::storebagNameForClientType(int32_t clientType) noexcept {
  const ClientType* row = telvane::clientType(clientType);
  if (row == nullptr) return std::nullopt;
  return row->storebagName;
}

StorebagRetriever::FetchResult StorebagRetriever::fetchStorebagForEnvironmentAndClientType(int32_t clientType) {
  Log& log = _context.log();
  FetchResult result;
  const auto name = storebagNameForClientType(clientType);
  if (!name.has_value()) {
    log.error("fetchStorebagForEnvironmentAndClientType: Could not find storebag name for client type {}", clientType);
    return result;
  }
  Metrics metrics;
  const std::optional<Dictionary> bag = fetchStorebagWithName(*name, metrics);
  result.maxAge = metrics.maxAge;
  result.unchanged = metrics.unchanged;
  if (!bag.has_value()) {
    if (!metrics.unchanged) {
      log.error("fetchStorebagForEnvironmentAndClientType: Could not fetch storebag for client type {}", clientType);
    }
    return result;
  }
  result.section = storebagSectionForEnvironment(_context, *bag, clientType).content;
  if (!result.section.has_value()) return result;
  result.version = (*bag)[kStorebagVersion];
  if (const Value& refreshCycle = (*bag)[kStorebagRefreshCycle]; refreshCycle.isPresent()) {
    const int64_t seconds = std::min(refreshCycle.integerValue(), kMaximumRefreshCycle);
    result.maxAge = static_cast<int32_t>(std::max<int64_t>(seconds, INT32_MIN));
    log.message("fetchStorebagForEnvironmentAndClientType: Store bag override MaxAge={}", result.maxAge);
  }
  return result;
}

std::optional<Dictionary> StorebagRetriever::fetchStorebagWithName(std::string_view name, Metrics& metrics) {
  metrics = Metrics();
  std::optional<Data> data = loadCachedStorebag(name, metrics);
  if (!data.has_value()) data = fetchNetworkStorebag(name, true, std::nullopt);
  MonitorLock lock(*_storebagLock);
  // A download that was waited for has just stored a new max-age.
  metrics.maxAge = _cache.lastLoadedMaxAge(name);
  if (metrics.unchanged) return std::nullopt;
  // No data is an envelope in which nothing is found, and is logged as such.
  return verifyAndParseStorebag(name, data.value_or(Data()), false);
}

std::optional<Data> StorebagRetriever::loadCachedStorebag(std::string_view name, Metrics& metrics) {
  std::optional<String> lastModified;
  std::optional<Data> data;
  bool isExpired = false;
  {
    MonitorLock lock(*_storebagLock);
    data = _cache.loadStorebagFromDisk(name);
    if (!data.has_value()) return std::nullopt;
    metrics.maxAge = _cache.lastLoadedMaxAge(name);
    metrics.unchanged = _cache.updateLastModified(name, lastModified);
    const std::optional<Date> modified = _cache.storebagCacheModificationDate(name);
    const double now = _context.platform().clock.now().secondsSince1970();
    const double age = modified.has_value() ? std::fabs(now - modified->secondsSince1970()) : 0;
    isExpired = age > static_cast<double>(metrics.maxAge);
    _context.log().message("fetchStorebagWithName: storebag '{}' loaded from disk cache. Disk cache {} refreshed", name,
                           isExpired ? "expired and will be" : "is valid and will not be");
  }
  if (isExpired) static_cast<void>(fetchNetworkStorebag(name, false, lastModified).has_value());
  return data;
}

std::string StorebagRetriever::storebagServerURL() const {
  const auto url = userDefaultsString(_context.platform().userDefaults, kDefaultsStorebagURL);
  if (url.has_value()) return url->str();
  return _context.isInternalBuild() ? TELVANE_INTERNAL_STOREBAG_URL : TELVANE_STOREBAG_URL;
}

URLRequest StorebagRetriever::storebagRequest(std::string_view name, const std::optional<String>& lastModified) const {
  URLRequest request;
  request.url = fmt::format("{}/{}?version={}", storebagServerURL(), name, _context.clientFrameworkVersion());
  request.cachePolicy = URLRequest::CachePolicy::ReloadIgnoringLocalCache;
  request.timeout = kRequestTimeout;
  _context.log().message("fetchNetworkStorebag: Storebag Server URL: {}", request.url);
  if (lastModified.has_value()) {
    _context.log().message("fetchNetworkStorebag: Adding 'Last-Modified: {}' to the header", *lastModified);
    request.setHeader("If-Modified-Since", lastModified->str());
  }
  return request;
}

std::shared_ptr<ReportingSessionConnectivityHelper> StorebagRetriever::connectivityHelper() {
  MonitorLock lock(*_storebagLock);
  if (_storebagConnectivityHelper == nullptr) {
    _storebagConnectivityHelper = ReportingSessionConnectivityHelper::initWithDelegate(
        _context, _shared, {}, ReportingSessionConnectivityHelper::GETRequestMode(),
        {{kTelvaneUserInfoClientName, kHelperClientName}, {kTelvaneUserInfoServiceName, kHelperServiceName}});
    _storebagConnectivityHelper->activate(kHelperReleaseTimeout);
  }
  return _storebagConnectivityHelper;
}

std::optional<Data> StorebagRetriever::fetchNetworkStorebag(std::string_view name, bool urgent,
                                                            const std::optional<String>& lastModified) {
  URLRequest request = storebagRequest(name, lastModified);
  const std::string url = request.url;
  const auto helper = connectivityHelper();
  if (!urgent) {
    helper->getURLRequestWithCompletionHandler(
        std::move(request), false,
        [weakSelf = weak_from_this(), name](const Data& data, const URLResponse* response,
                                            const std::optional<Error>& error) {
          if (const auto self = weakSelf.lock()) self->handleNetworkStorebag(name, data, response, error);
        });
    return std::nullopt;
  }
  const std::shared_ptr<Semaphore> answered = _context.platform().dispatch.newSemaphore(0);
  const auto download = std::make_shared<Download>();
  helper->getURLRequestWithCompletionHandler(
      std::move(request), true,
      [this, name, answered, download](const Data& data, const URLResponse* response,
                                       const std::optional<Error>& error) {
        *download = Download{data, error, response != nullptr ? response->statusCode : 0};
        handleNetworkStorebag(name, data, response, error);
        answered->signal();
      });
  answered->wait();
  return finishUrgentFetch(name, url, *download);
}

void StorebagRetriever::handleNetworkStorebag(std::string_view name, const Data& data, const URLResponse* response,
                                              const std::optional<Error>& error) {
  if (error.has_value() || response == nullptr || response->statusCode != kStatusOK) {
    _context.log().message(
        "fetchNetworkStorebag: storebag '{}' does not need update as its content has not changed on the server", name);
    return;
  }
  MonitorLock lock(*_storebagLock);
  _cache.saveLastLoadedStorebagMetricsWithName(name, *response);
  if (data.empty()) {
    _context.log().message("fetchNetworkStorebag: received zero-length storebag for '{}‘, treat as unchanged", name);
    return;
  }
  static_cast<void>(verifyAndParseStorebag(name, data, true).has_value());
}

std::optional<Data> StorebagRetriever::finishUrgentFetch(std::string_view name, const std::string& url,
                                                         const Download& download) {
  if (!download.error.has_value() && download.statusCode == kStatusOK) return download.data;
  _context.log().message("fetchNetworkStorebag: Error resolving with lookup server {}, sendSynchronousRequest error {}",
                         url, download.error.has_value() ? download.error->description() : "(null)");
  if (name != kConferencingStorebagName) return std::nullopt;
  _context.log().message("fetchNetworkStorebag: Loading default storebag '{}'", name);
  return defaultStorebagData();
}

std::optional<Dictionary> StorebagRetriever::verifyAndParseStorebag(std::string_view name, const Data& envelope,
                                                                    bool saveToDisk) {
  Log& log = _context.log();
  const std::optional<Data> bag = openStorebagEnvelope(log, _context.platform().clientBundle, envelope);
  if (!bag.has_value()) return std::nullopt;
  if (saveToDisk && _cache.saveStorebagToDisk(name, envelope)) {
    log.message("fetchStorebagWithName: storebag '{}' has been saved to disk cache", name);
  }
  const Result<Value> inner = propertylist::parse(*bag);
  if (inner.has_error() || !inner->isDictionary()) {
    log.error("fetchStorebagWithName: storebag '{}' is signed but is no dictionary: {}", name,
              inner.has_error() ? inner.error().description() : "another kind of value");
    return std::nullopt;
  }
  return expandStorebag(log, *inner->dictionary());
}

Data StorebagRetriever::defaultStorebagData() const {
  const Dictionary section{{kTelvaneBackendVDR, Dictionary{{kProfileActive, true}}}};
  const Dictionary bag{{kEnvironmentInternal, section},
                       {kEnvironmentDevelopment, section},
                       {kEnvironmentRelease, section},
                       {kStorebagVersion, "1.0.0-Confluxa-Fallback"},
                       {kStorebagRefreshCycle, 3600}};
  return propertylist::serialize(bag, propertylist::Format::Binary).value();
}

std::optional<Date> StorebagRetriever::storebagCacheModificationDate(std::string_view name) {
  return _cache.storebagCacheModificationDate(name);
}

}  // namespace telvane
