#include "backends/UDPPacketToSend.h"

#include <gtest/gtest.h>

#include <array>
#include <string>

namespace telvane::testing {
namespace {

constexpr std::array<uint8_t, 5> kBytes = {1, 0, 255, 0, 7};

std::string_view textOf(const UDPPacketToSend& packet) { return packet.data().view(); }

std::string expectedText() { return {kBytes.begin(), kBytes.end()}; }

UDPPacketToSend packet() { return UDPPacketToSend::initWithBytes(kBytes.data(), kBytes.size(), 4711); }

TEST(UDPPacketToSendTest, beginsNotYetSentWithNothingCounted) {
  const UDPPacketToSend made = packet();
  EXPECT_EQ(made.state(), 0);
  EXPECT_EQ(made.state(), UDPPacketToSend::kNotYetSent);
  EXPECT_EQ(made.numberOfChecks(), 0u);
  EXPECT_EQ(made.numberOfRetransmits(), 0u);
  EXPECT_EQ(made.eventNumber(), 4711);
  EXPECT_EQ(textOf(made), expectedText());
}

// A backend frees or reuses its buffer as soon as the packet is made.
TEST(UDPPacketToSendTest, copiesItsBytes) {
  std::array<uint8_t, 5> buffer = kBytes;
  const UDPPacketToSend made = UDPPacketToSend::initWithBytes(buffer.data(), buffer.size(), 1);
  buffer.fill(9);
  EXPECT_EQ(textOf(made), expectedText());
}

TEST(UDPPacketToSendTest, takesOnlySoManyBytes) {
  EXPECT_EQ(textOf(UDPPacketToSend::initWithBytes(kBytes.data(), 2, 1)), expectedText().substr(0, 2));
  EXPECT_EQ(textOf(UDPPacketToSend::initWithBytes(kBytes.data(), 0, 1)), "");
}

TEST(UDPPacketToSendTest, givesBackWhatWasSetAndTouchesNothingElse) {
  UDPPacketToSend changed = packet();
  changed.setState(UDPPacketToSend::kWaitingForAcknowledgement);
  EXPECT_EQ(changed.state(), 1);
  changed.setNumberOfChecks(8);
  EXPECT_EQ(changed.numberOfChecks(), 8u);
  changed.setNumberOfRetransmits(3);
  EXPECT_EQ(changed.numberOfRetransmits(), 3u);
  changed.setEventNumber(12);
  EXPECT_EQ(changed.eventNumber(), 12);
  EXPECT_EQ(textOf(changed), expectedText());
  changed.setData(Data::copyOf("other"));
  EXPECT_EQ(textOf(changed), "other");
  EXPECT_EQ(changed.state(), 1);
  EXPECT_EQ(changed.numberOfChecks(), 8u);
  EXPECT_EQ(changed.numberOfRetransmits(), 3u);
  EXPECT_EQ(changed.eventNumber(), 12);
}

TEST(UDPPacketToSendTest, holdsTheWholeRangeOfItsFields) {
  UDPPacketToSend changed = packet();
  changed.setState(INT32_MIN);
  changed.setNumberOfChecks(UINT32_MAX);
  changed.setNumberOfRetransmits(UINT32_MAX);
  changed.setEventNumber(UINT16_MAX);
  EXPECT_EQ(changed.state(), INT32_MIN);
  EXPECT_EQ(changed.numberOfChecks(), UINT32_MAX);
  EXPECT_EQ(changed.numberOfRetransmits(), UINT32_MAX);
  EXPECT_EQ(changed.eventNumber(), UINT16_MAX);
}

}  // namespace
}  // namespace telvane::testing
