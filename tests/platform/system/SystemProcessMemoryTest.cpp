#include "platform/system/SystemProcessMemory.h"

#include <gtest/gtest.h>
#include <sys/mman.h>

#include <cstring>

namespace telvane {
namespace {

TEST(SystemProcessMemoryTest, growsWithTheMemoryThatTheProcessUses) {
  constexpr size_t kSize = 32u << 20;
  const SystemProcessMemory memoryOfProcess;
  const uint64_t before = memoryOfProcess.taskMemory();
  ASSERT_GT(before, 0u);
  void* memory = ::mmap(nullptr, kSize, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
  ASSERT_NE(memory, MAP_FAILED);
  std::memset(memory, 1, kSize);
  const uint64_t during = memoryOfProcess.taskMemory();
  ::munmap(memory, kSize);
  EXPECT_GE(during, before + kSize * 3 / 4) << "before " << before;
}

}  // namespace
}  // namespace telvane
