#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace telvane::bench {

// One kept TLS connection to a server, with libcurl and nothing in between: what any program would do that posts by
// itself. Its calls wait for the answer. For one thread.
class KeptConnection {
 public:
  // authorityFile: the PEM file of the authority to be trusted. headers: "Name: value" each, sent with every request.
  KeptConnection(const std::string& url, const std::string& authorityFile, const std::vector<std::string>& headers);
  ~KeptConnection();
  KeptConnection(const KeptConnection&) = delete;
  KeptConnection& operator=(const KeptConnection&) = delete;

  // Replaces the headers of the requests to come.
  void setHeaders(const std::vector<std::string>& headers);
  // Returns whether the answer was 200.
  bool post(std::string_view body);
  // Returns the body of the answer; nothing when none came.
  std::optional<std::string> get();

 private:
  class Handles;
  const std::unique_ptr<Handles> _handles;
};

}  // namespace telvane::bench
