#include "platform/url/ConnectivityProbe.h"

#include <ifaddrs.h>
#include <net/if.h>
#include <sys/socket.h>

namespace telvane {

bool InterfaceConnectivityProbe::hasNetwork() {
  ifaddrs* first = nullptr;
  if (getifaddrs(&first) != 0) return true;
  bool found = false;
  for (const ifaddrs* entry = first; entry != nullptr && !found; entry = entry->ifa_next) {
    if (entry->ifa_addr == nullptr) continue;
    const int family = entry->ifa_addr->sa_family;
    const bool isUp = (entry->ifa_flags & IFF_UP) != 0 && (entry->ifa_flags & IFF_LOOPBACK) == 0;
    found = isUp && (family == AF_INET || family == AF_INET6);
  }
  freeifaddrs(first);
  return found;
}

}  // namespace telvane
