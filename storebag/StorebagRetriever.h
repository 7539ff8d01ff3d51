#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "connectivity/ReportingSessionConnectivityHelper.h"
#include "foundation/Value.h"
#include "storebag/StorebagCache.h"
#include "util/ProcessContext.h"

namespace telvane {

// Fetches storebags by name over HTTPS, verifies them, keeps the signed bytes on disk and their freshness in the user
// defaults, and hands out the section of the device's environment.
//
// Made by the entry point as a shared object, one per process; owns the connectivity helper through which all bags are
// fetched. Safe from any thread.
//
// A fetch that needs the network blocks its caller until the request has completed, 15 s at most. That holds for the
// first request of a bag in the life of the process. The helper asks for each URL once and drops a second request
// without calling its completion; a fetch that stands on that completion never returns, and whatever the caller holds
// stays held. It comes to that when a bag is fetched again and there is still no file of it: the first answer was none,
// or no bag of ours, or the file has been removed. Only a new process asks again.
class StorebagRetriever : public std::enable_shared_from_this<StorebagRetriever> {
 public:
  struct FetchResult {
    std::optional<Dictionary> section;
    int32_t maxAge = 0;  // seconds
    Value version;       // the bag's version text; absent when there is none
    bool unchanged = false;
  };

  StorebagRetriever(const ProcessContext& context, ConnectivityShared& shared);
  ~StorebagRetriever();

  // Returns the storebag name of a client type, or nothing for a type without one (below 5, above 30).
  static std::optional<std::string_view> storebagNameForClientType(int32_t clientType) noexcept;
  // Returns the environment's section with macros expanded and "release_timeout" added when the bag has it.
  FetchResult fetchStorebagForEnvironmentAndClientType(int32_t clientType);
  // The modification date of the bag's cache file; nothing when it cannot be read.
  std::optional<Date> storebagCacheModificationDate(std::string_view name);

 private:
  struct Metrics {
    int32_t maxAge = 0;
    bool unchanged = false;
  };
  // What a waiting caller learns of its download.
  struct Download {
    Data data;
    std::optional<Error> error;
    int statusCode = 0;
  };

  std::optional<Dictionary> fetchStorebagWithName(std::string_view name, Metrics& metrics);
  // Loads the cached envelope and, when it is older than its max-age, starts its refresh in the background.
  std::optional<Data> loadCachedStorebag(std::string_view name, Metrics& metrics);
  // urgent: waits for the answer and returns the envelope; otherwise starts a refresh within two hours, returns
  // nothing.
  std::optional<Data> fetchNetworkStorebag(std::string_view name, bool urgent,
                                           const std::optional<String>& lastModified);
  std::optional<Data> finishUrgentFetch(std::string_view name, const std::string& url, const Download& download);
  void handleNetworkStorebag(std::string_view name, const Data& data, const URLResponse* response,
                             const std::optional<Error>& error);
  URLRequest storebagRequest(std::string_view name, const std::optional<String>& lastModified) const;
  std::shared_ptr<ReportingSessionConnectivityHelper> connectivityHelper();
  std::optional<Dictionary> verifyAndParseStorebag(std::string_view name, const Data& envelope, bool saveToDisk);
  std::string storebagServerURL() const;
  Data defaultStorebagData() const;

  const ProcessContext& _context;
  ConnectivityShared& _shared;
  const StorebagCache _cache;
  // The storebag lock: held around loading with its metrics, around parsing, and around saving a download. Always taken
  // after the agent's lock when both are held.
  const std::unique_ptr<Monitor> _storebagLock;
  // Made on first use, then kept.
  std::shared_ptr<ReportingSessionConnectivityHelper> _storebagConnectivityHelper GUARDED_BY(*_storebagLock);
};

}  // namespace telvane
