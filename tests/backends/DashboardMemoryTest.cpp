// What a dashboard backend does when there is no memory for a datagram.
#include <gtest/gtest.h>

#include <new>

#include "tests/backends/DashboardFixture.h"

namespace {

thread_local bool isMemoryRefused = false;

}  // namespace

// This program's own, for the allocations that ask to be told and not thrown at; the others are as always.
void* operator new[](std::size_t size, const std::nothrow_t&) noexcept {
  if (isMemoryRefused) return nullptr;
  try {
    return ::operator new[](size);
  } catch (const std::bad_alloc&) {
    return nullptr;
  }
}

namespace telvane::testing {
namespace {

class DashboardMemoryTest : public DashboardFixture {};

TEST_F(DashboardMemoryTest, anEventWithoutMemoryForItsDatagramIsLostWithALine) {
  make();
  log().expectError("DashboardBackend(sendMessage): can't malloc.");
  isMemoryRefused = true;
  const std::optional<String> line = send({{Key("n"), 1}});
  isMemoryRefused = false;
  EXPECT_EQ(line, std::nullopt);
  EXPECT_TRUE(hasLines(log(), 1, "DashboardBackend(sendMessage): can't malloc."));
  EXPECT_TRUE(dashboard().arrivals().empty());
  EXPECT_NE(send({{Key("n"), 2}}), std::nullopt) << "and the next one goes out";
  EXPECT_EQ(lastTextAt(dashboard()), " n=2");
}

}  // namespace
}  // namespace telvane::testing
