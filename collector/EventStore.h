#pragma once

#include <atomic>
#include <cstdint>
#include <memory>

#include "foundation/Error.h"
#include "foundation/Value.h"
#include "platform/system/AppendFile.h"
#include "platform/url/HTTPServer.h"

namespace telvane {

// Takes posted batches of events: writes one JSON line per event,
// {"event": …, "clientId": …, "postTime": …, "headers": {…}}, or only counts them. Safe from any thread.
class EventStore {
 public:
  // file: null to count only.
  explicit EventStore(std::unique_ptr<AppendFile> file) : _file(std::move(file)) {}

  // Takes the body of one post (gzip when Content-Encoding says so) and answers 200, 400 with the reason when it is no
  // batch of events, 500 when it could not be stored.
  HTTPServer::Response take(const HTTPServer::Request& request);
  // Writes one line that somebody else made of an event, and counts nothing.
  Result<void> add(const Dictionary& line);

  uint64_t events() const noexcept { return _events; }
  uint64_t posts() const noexcept { return _posts; }
  // Bytes of bodies as they came.
  uint64_t bytes() const noexcept { return _bytes; }

 private:
  Result<uint64_t> store(const HTTPServer::Request& request, std::string_view json);

  const std::unique_ptr<AppendFile> _file;
  std::atomic<uint64_t> _events{0};
  std::atomic<uint64_t> _posts{0};
  std::atomic<uint64_t> _bytes{0};
};

}  // namespace telvane
