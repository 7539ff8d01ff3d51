#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>

#include "platform/url/HTTPServer.h"

namespace telvane {

// Keeps what devices upload, one file each, below one folder: files (POST /upload) under their own name made safe, log
// data (POST /logdata) as "logdata.plist". Bodies go to the disk as they come, in pieces, and stay as they came:
// compressed ones are not unpacked. Safe from any thread.
class UploadStore {
 public:
  enum class Kind { File, LogData };
  // Hears of each upload, in one line, from the server's threads.
  using Listener = std::function<void(const std::string& line)>;

  // folder: made when the first upload comes; empty: uploads are refused, which devices take as a reason to keep their
  // files. listener: may be empty.
  UploadStore(std::string folder, Listener listener) : _folder(std::move(folder)), _listener(std::move(listener)) {}

  // Returns what takes the body of the upload; without a folder it drops it, whatever its size.
  std::shared_ptr<HTTPServer::BodySink> newSink() const;
  // Keeps what the request's sink has taken, and answers: a file with JSON whose "result" is "success", log data with
  // the location where they are kept, as text; 403 without a folder, 400 without a body, 500 when they cannot be kept
  // (the listener hears why). A refusal of log data has no body.
  HTTPServer::Response take(Kind kind, const HTTPServer::Request& request);

  uint64_t files() const noexcept { return _files; }
  uint64_t logData() const noexcept { return _logData; }
  // Bytes of both as they came.
  uint64_t bytes() const noexcept { return _bytes; }

 private:
  class Sink;
  class DroppingSink;
  HTTPServer::Response cannotKeep(Kind kind, const Error& error);
  HTTPServer::Response kept(Kind kind, const HTTPServer::Request& request, const std::string& name, uint64_t size);

  const std::string _folder;
  const Listener _listener;
  std::atomic<uint64_t> _files{0};
  std::atomic<uint64_t> _logData{0};
  std::atomic<uint64_t> _bytes{0};
};

}  // namespace telvane
