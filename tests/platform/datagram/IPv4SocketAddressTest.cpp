#include "platform/IPv4SocketAddress.h"

#include <gtest/gtest.h>

namespace telvane::testing {
namespace {

TEST(IPv4SocketAddressTest, readsDottedAddressesAndWritesThemBack) {
  for (const char* text : {"0.0.0.0", "127.0.0.1", "192.0.2.7", "255.255.255.255"}) {
    const auto address = ipv4SocketAddress(text, 9000);
    ASSERT_TRUE(address.has_value()) << text;
    EXPECT_EQ(description(*address), std::string(text) + ":9000");
  }
  const auto address = ipv4SocketAddress("1.2.3.4", 65535);
  EXPECT_EQ(address->address, (std::array<uint8_t, 4>{1, 2, 3, 4}));
  EXPECT_EQ(address->port, 65535);
}

TEST(IPv4SocketAddressTest, refusesEverythingElse) {
  for (const std::string_view text : {std::string_view(),
                                      {"1.2.3"},
                                      {"1.2.3.4.5"},
                                      {"1.2.3.256"},
                                      {"1.2.3.4 "},
                                      {" 1.2.3.4"},
                                      {"1.2.3.4\n"},
                                      {"localhost"},
                                      {"::1"},
                                      {"0x1.2.3.4"},
                                      {"1..2.3"},
                                      {"1.2.3.-4"},
                                      {"1.2.3.4\0x", 9},
                                      {"255.255.255.2550"},
                                      {"255.255.255.255.255.255"}}) {
    EXPECT_EQ(ipv4SocketAddress(text, 1), std::nullopt) << text;
  }
}

}  // namespace
}  // namespace telvane::testing
