#include "backends/UDPPacketToSend.h"

#include <span>

namespace telvane {

UDPPacketToSend UDPPacketToSend::initWithBytes(const uint8_t* bytes, size_t length, uint16_t eventNumber) {
  UDPPacketToSend packet;
  packet._data = Data::copyOf(std::span(bytes, length));
  packet._eventNumber = eventNumber;
  return packet;
}

}  // namespace telvane
