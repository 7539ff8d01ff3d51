#pragma once

#include <memory>
#include <string>

#include "collector/CollectorOptions.h"
#include "collector/DashboardReceiver.h"
#include "collector/EventStore.h"
#include "collector/StorebagFolder.h"
#include "collector/UploadStore.h"
#include "foundation/Error.h"
#include "platform/FileSystem.h"
#include "platform/url/HTTPServer.h"

namespace telvane {

// The reference server: hands out storebags (GET /storebags/<name>), takes events (POST /events), files (POST /upload)
// and log data (POST /logdata), receives dashboard datagrams where it is asked to, and tells what it counted (GET
// /statistics: {"events", "posts", "bytes", "uploads", "logData", "uploadBytes"}, and under "dashboard" what
// DashboardReceiver::statistics counts). Owned by its program; serves on threads of its own until it is let go of.
class Collector {
 public:
  // files: outlives the collector. listener: hears of uploads and datagrams, a line each, from the collector's threads;
  // may be empty. Fails when the address, the certificate or the event file cannot be used.
  static Result<std::unique_ptr<Collector>> start(const CollectorOptions& options, FileSystem& files,
                                                  UploadStore::Listener listener = nullptr);
  ~Collector();
  Collector(const Collector&) = delete;
  Collector& operator=(const Collector&) = delete;

  // HOST:PORT that is served.
  const std::string& address() const noexcept { return _server->address(); }
  const EventStore& events() const noexcept { return _events; }
  const UploadStore& uploads() const noexcept { return _uploads; }
  // Null when no dashboard was asked for.
  const DashboardReceiver* dashboard() const noexcept { return _dashboard.get(); }

 private:
  Collector(const CollectorOptions& options, FileSystem& files, std::unique_ptr<AppendFile> eventFile,
            UploadStore::Listener listener);
  Result<void> startDashboard(const CollectorOptions& options, DashboardReceiver::Listener listener);
  std::shared_ptr<HTTPServer::BodySink> sinkFor(const HTTPServer::Request& head) const;
  HTTPServer::Response answer(const HTTPServer::Request& request);
  HTTPServer::Response statistics() const;

  const StorebagFolder _storebags;
  EventStore _events;
  UploadStore _uploads;
  std::unique_ptr<DashboardReceiver> _dashboard;
  std::unique_ptr<HTTPServer> _server;  // last, so that it ends first
};

}  // namespace telvane
