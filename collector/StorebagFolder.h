#pragma once

#include <chrono>
#include <string>
#include <string_view>

#include "platform/FileSystem.h"
#include "platform/url/HTTPServer.h"

namespace telvane {

// Serves the signed storebags of one folder, as they are. Read anew at each request, so a bag is published by putting
// its file there. Safe from any thread.
class StorebagFolder {
 public:
  // files: outlives this object. maxAge: what Cache-Control tells clients.
  StorebagFolder(FileSystem& files, std::string folder, std::chrono::seconds maxAge)
      : _files(files), _folder(std::move(folder)), _maxAge(maxAge) {}

  // Answers a request for the bag: 200 with Last-Modified and Cache-Control, 304 when If-Modified-Since names the
  // file's date, 404 when there is none. name: as the request has it. A name may hold letters, digits, '-', '_' and
  // '.', and not begin with '.', so no name leads out of the folder.
  HTTPServer::Response answer(std::string_view name, const HTTPServer::Request& request) const;

 private:
  FileSystem& _files;
  const std::string _folder;
  const std::chrono::seconds _maxAge;
};

}  // namespace telvane
