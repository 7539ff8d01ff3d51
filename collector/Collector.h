#pragma once

#include <memory>
#include <string>

#include "collector/CollectorOptions.h"
#include "collector/EventStore.h"
#include "collector/StorebagFolder.h"
#include "foundation/Error.h"
#include "platform/FileSystem.h"
#include "platform/url/HTTPServer.h"

namespace telvane {

// The reference server: hands out storebags (GET /storebags/<name>), takes events (POST /events), and tells what it
// counted (GET /statistics: {"events", "posts", "bytes"}). Owned by its program; serves on threads of its own until it
// is let go of.
class Collector {
 public:
  // files: outlives the collector. Fails when the address, the certificate or the event file cannot be used.
  static Result<std::unique_ptr<Collector>> start(const CollectorOptions& options, FileSystem& files);
  ~Collector();
  Collector(const Collector&) = delete;
  Collector& operator=(const Collector&) = delete;

  // HOST:PORT that is served.
  const std::string& address() const noexcept { return _server->address(); }
  const EventStore& events() const noexcept { return _events; }

 private:
  Collector(const CollectorOptions& options, FileSystem& files, std::unique_ptr<AppendFile> eventFile);
  HTTPServer::Response answer(const HTTPServer::Request& request);
  HTTPServer::Response statistics() const;

  const StorebagFolder _storebags;
  EventStore _events;
  std::unique_ptr<HTTPServer> _server;  // last, so that it ends first
};

}  // namespace telvane
