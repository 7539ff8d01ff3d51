#include "platform/Random.h"

#include <gtest/gtest.h>

#include <cstring>
#include <set>
#include <vector>

#include "platform/dispatch/SystemRandom.h"

namespace telvane::testing {
namespace {

// Gives the numbers that it was made with, one for each four bytes asked for, and again from the start.
class ScriptedRandom final : public Random {
 public:
  explicit ScriptedRandom(std::vector<uint32_t> numbers) : _numbers(std::move(numbers)) {}
  void fill(std::span<uint8_t> bytes) override {
    for (size_t i = 0; i + 4 <= bytes.size(); i += 4) {
      std::memcpy(&bytes[i], &_numbers[_drawn++ % _numbers.size()], 4);
    }
  }
  size_t drawn() const { return _drawn; }

 private:
  const std::vector<uint32_t> _numbers;
  size_t _drawn = 0;
};

TEST(RandomTest, isZeroWithoutDrawingForTheBoundsZeroAndOne) {
  ScriptedRandom random({7});
  EXPECT_EQ(random.uniform(0), 0u);
  EXPECT_EQ(random.uniform(1), 0u);
  EXPECT_EQ(random.drawn(), 0u);
}

TEST(RandomTest, drawsAgainWhatWouldFavourLowNumbers) {
  // 2^32 is 1 above a multiple of 3: one of all values, 0, has to go.
  ScriptedRandom random({0, 0, 5});
  EXPECT_EQ(random.uniform(3), 2u);
  EXPECT_EQ(random.drawn(), 3u);
}

TEST(RandomTest, staysBelowTheLargestBound) {
  ScriptedRandom random({0, UINT32_MAX});
  EXPECT_EQ(random.uniform(UINT32_MAX), 0u);
  EXPECT_EQ(random.drawn(), 2u);
}

TEST(RandomTest, marksItsIdentifiersAsRandomOnes) {
  ScriptedRandom random({UINT32_MAX});
  EXPECT_EQ(random.newUUID().string(), "FFFFFFFF-FFFF-4FFF-BFFF-FFFFFFFFFFFF");
}

TEST(SystemRandomTest, reachesEveryNumberBelowTheBound) {
  SystemRandom random;
  std::set<uint32_t> seen;
  // A number stays away from 10,000 draws once in 10^457 runs.
  for (int i = 0; i < 10000; ++i) seen.insert(random.uniform(10));
  EXPECT_EQ(seen.size(), 10u);
  EXPECT_EQ(*seen.rbegin(), 9u);
}

TEST(SystemRandomTest, fillsMoreThanOneCallOfTheSystemGives) {
  SystemRandom random;
  std::vector<uint8_t> bytes(1u << 20);
  random.fill(bytes);
  const std::set<uint8_t> last(bytes.end() - 4096, bytes.end());
  EXPECT_GT(last.size(), 200u) << "the end of the buffer does not look random";
}

TEST(SystemRandomTest, makesIdentifiersThatDiffer) {
  SystemRandom random;
  EXPECT_NE(random.newUUID().string(), random.newUUID().string());
}

}  // namespace
}  // namespace telvane::testing
