#pragma once

#include <string>

#include "platform/URLSession.h"

namespace telvane::testing {

// What a request sends, wherever it comes from.
inline Data bodyBytes(const URLRequest& request) {
  if (request.bodyFile == nullptr) return request.body;
  std::string bytes(request.bodyFile->size(), '\0');
  size_t count = 0;
  while (count < bytes.size()) {
    const int64_t read = request.bodyFile->read(count, std::span(bytes).subspan(count));
    if (read <= 0) break;
    count += static_cast<size_t>(read);
  }
  bytes.resize(count);
  return Data(std::move(bytes));
}

}  // namespace telvane::testing
