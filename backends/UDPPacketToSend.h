#pragma once

#include <cstddef>
#include <cstdint>

#include "foundation/Data.h"

namespace telvane {

// A datagram that a dashboard backend has not sent yet, or that its server has not acknowledged yet. A value; confined
// to the backend's network queue.
class UDPPacketToSend {
 public:
  // No other states are known; a packet in one stays where it is.
  static constexpr int32_t kNotYetSent = 0;
  static constexpr int32_t kWaitingForAcknowledgement = 1;

  // Copies the bytes. eventNumber: the event ID that they carry, by which they are acknowledged.
  static UDPPacketToSend initWithBytes(const uint8_t* bytes, size_t length, uint16_t eventNumber);

  int32_t state() const noexcept { return _state; }
  void setState(int32_t state) noexcept { _state = state; }
  // Ticks of the backend's timer since the last transmission.
  uint32_t numberOfChecks() const noexcept { return _numberOfChecks; }
  void setNumberOfChecks(uint32_t number) noexcept { _numberOfChecks = number; }
  uint32_t numberOfRetransmits() const noexcept { return _numberOfRetransmits; }
  void setNumberOfRetransmits(uint32_t number) noexcept { _numberOfRetransmits = number; }
  uint16_t eventNumber() const noexcept { return _eventNumber; }
  void setEventNumber(uint16_t number) noexcept { _eventNumber = number; }
  // The whole datagram.
  const Data& data() const noexcept { return _data; }
  void setData(Data data) { _data = std::move(data); }

 private:
  int32_t _state = kNotYetSent;
  uint32_t _numberOfChecks = 0;
  uint32_t _numberOfRetransmits = 0;
  uint16_t _eventNumber = 0;
  Data _data;
};

}  // namespace telvane
