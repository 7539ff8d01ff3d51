#include "collector/StorebagFolder.h"

#include <fmt/format.h>

#include <algorithm>

#include "collector/HTTPDate.h"

namespace telvane {
namespace {

constexpr uint64_t kMaximumBagBytes = 16u << 20;
constexpr size_t kLongestName = 128;

bool isBagName(std::string_view name) {
  const auto isAllowed = [](unsigned char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '-' || c == '_' ||
           c == '.';
  };
  return !name.empty() && name.size() <= kLongestName && name.front() != '.' &&
         std::all_of(name.begin(), name.end(), isAllowed);
}

HTTPServer::Response notFound() { return {404, {{"Content-Type", "text/plain"}}, Data::copyOf("no such storebag\n")}; }

}  // namespace

HTTPServer::Response StorebagFolder::answer(std::string_view name, const HTTPServer::Request& request) const {
  if (!isBagName(name)) return notFound();
  const std::string path = _folder + "/" + std::string(name);
  const auto modified = _files.modificationDate(path);
  Result<Data> bag = _files.read(path, kMaximumBagBytes);
  if (!modified.has_value() || bag.has_error()) return notFound();
  HTTPServer::Response response;
  const std::string lastModified = httpDate(*modified);
  response.headers = {{"Last-Modified", lastModified}, {"Cache-Control", fmt::format("max-age={}", _maxAge.count())}};
  const std::string* known = request.header("If-Modified-Since");
  if (known != nullptr && *known == lastModified) {
    response.status = 304;
    return response;
  }
  response.headers.push_back({"Content-Type", "application/octet-stream"});
  response.body = std::move(*bag);
  return response;
}

}  // namespace telvane
