#pragma once

#include <netinet/in.h>

#include "platform/IPv4SocketAddress.h"

// The address as system calls take it. Only sources of this folder read this.
namespace telvane {

sockaddr_in systemAddress(const IPv4SocketAddress& address) noexcept;
IPv4SocketAddress fromSystemAddress(const sockaddr_in& address) noexcept;

}  // namespace telvane
