#include "platform/URLSession.h"

#include <strings.h>

#include <algorithm>

namespace telvane {

namespace {

bool isSameName(std::string_view a, std::string_view b) {
  return a.size() == b.size() && strncasecmp(a.data(), b.data(), a.size()) == 0;
}

}  // namespace

void URLRequest::setHeader(std::string name, std::string value) {
  const auto isNamed = [&name](const Header& header) { return isSameName(header.name, name); };
  const auto found = std::find_if(headers.begin(), headers.end(), isNamed);
  if (found == headers.end()) {
    headers.push_back({std::move(name), std::move(value)});
  } else {
    found->value = std::move(value);
  }
}

const std::string* URLResponse::header(std::string_view name) const noexcept {
  for (const URLRequest::Header& header : headers) {
    if (isSameName(header.name, name)) return &header.value;
  }
  return nullptr;
}

}  // namespace telvane
