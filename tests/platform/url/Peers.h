#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <thread>

namespace telvane::testing {

// A connected TCP socket that says and hears bytes as they are on the wire. Waits at most some seconds.
class RawPeer {
 public:
  explicit RawPeer(int socket);
  // Connects to a port of 127.0.0.1.
  static RawPeer to(uint16_t port);
  RawPeer(RawPeer&& other) noexcept;
  RawPeer& operator=(RawPeer&&) = delete;
  ~RawPeer();

  void say(std::string_view bytes) const;
  // Hears until the text ends what was heard, or nothing more comes.
  std::string hearUntil(std::string_view end) const;
  // Hears that many bytes, or until nothing more comes.
  std::string hear(size_t count) const;
  // Hears until the other side ends; the result tells nothing about a silent one.
  std::string hearAll() const;
  // Whether the other side ends the connection.
  bool hearsEnd() const;

 private:
  int _socket;
};

// Listens on a free port of 127.0.0.1 and talks to one peer after the other as it is told.
class RawServer {
 public:
  using Talk = std::function<void(const RawPeer& peer, int connection)>;
  explicit RawServer(Talk talk);
  ~RawServer();
  RawServer(const RawServer&) = delete;
  RawServer& operator=(const RawServer&) = delete;

  uint16_t port() const noexcept { return _port; }

 private:
  int _socket;
  uint16_t _port = 0;
  std::thread _thread;
};

// A port of 127.0.0.1 on which nobody listens.
uint16_t unusedPort();

}  // namespace telvane::testing
