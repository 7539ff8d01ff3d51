#include "bench/KeptConnection.h"

#include <curl/curl.h>

#include <utility>

namespace telvane::bench {
namespace {

size_t append(char* bytes, size_t size, size_t count, void* text) {
  static_cast<std::string*>(text)->append(bytes, size * count);
  return size * count;
}

}  // namespace

class KeptConnection::Handles {
 public:
  Handles() : curl(curl_easy_init()) {}
  ~Handles() {
    curl_easy_cleanup(curl);
    curl_slist_free_all(headers);
  }
  Handles(const Handles&) = delete;
  Handles& operator=(const Handles&) = delete;

  bool perform() {
    answer.clear();
    long status = 0;
    return curl_easy_perform(curl) == CURLE_OK &&
           curl_easy_getinfo(curl, CURLINFO_RESPONSE_CODE, &status) == CURLE_OK && status == 200;
  }

  CURL* const curl;
  curl_slist* headers = nullptr;
  std::string answer;
};

KeptConnection::KeptConnection(const std::string& url, const std::string& authorityFile,
                               const std::vector<std::string>& headers)
    : _handles(std::make_unique<Handles>()) {
  CURL* curl = _handles->curl;
  curl_easy_setopt(curl, CURLOPT_URL, url.c_str());
  curl_easy_setopt(curl, CURLOPT_CAINFO, authorityFile.c_str());
  curl_easy_setopt(curl, CURLOPT_WRITEFUNCTION, append);
  curl_easy_setopt(curl, CURLOPT_WRITEDATA, &_handles->answer);
  curl_easy_setopt(curl, CURLOPT_NOSIGNAL, 1L);
  setHeaders(headers);
}

KeptConnection::~KeptConnection() = default;

void KeptConnection::setHeaders(const std::vector<std::string>& headers) {
  curl_slist* list = nullptr;
  for (const std::string& header : headers) list = curl_slist_append(list, header.c_str());
  curl_easy_setopt(_handles->curl, CURLOPT_HTTPHEADER, list);
  curl_slist_free_all(std::exchange(_handles->headers, list));
}

bool KeptConnection::post(std::string_view body) {
  curl_easy_setopt(_handles->curl, CURLOPT_POSTFIELDSIZE, static_cast<long>(body.size()));
  curl_easy_setopt(_handles->curl, CURLOPT_POSTFIELDS, body.data());
  return _handles->perform();
}

std::optional<std::string> KeptConnection::get() {
  curl_easy_setopt(_handles->curl, CURLOPT_HTTPGET, 1L);
  if (!_handles->perform()) return std::nullopt;
  return _handles->answer;
}

}  // namespace telvane::bench
