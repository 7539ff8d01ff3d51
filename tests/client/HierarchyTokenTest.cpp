#include "client/HierarchyToken.h"

#include <gtest/gtest.h>

#include <limits>

#include "interfaces/SessionKeys.h"
#include "tests/support/SeededRandom.h"

namespace telvane::testing {
namespace {

class HierarchyTokenTest : public ::testing::Test {
 protected:
  SeededRandom _random{1};
};

TEST_F(HierarchyTokenTest, startsANewHierarchyAtLevelZero) {
  const std::optional<Dictionary> token = newHierarchyTokenFromParentToken(_random, {});
  ASSERT_TRUE(token.has_value());
  EXPECT_EQ(token->size(), 2u);
  EXPECT_EQ((*token)[kTelvaneHierarchyTokenLevel], Value(0));
  EXPECT_EQ((*token)[kTelvaneHierarchyTokenTokenID].text().size(), 36u);
}

TEST_F(HierarchyTokenTest, givesEachNewHierarchyItsOwnToken) {
  EXPECT_NE((*newHierarchyTokenFromParentToken(_random, {}))[kTelvaneHierarchyTokenTokenID],
            (*newHierarchyTokenFromParentToken(_random, {}))[kTelvaneHierarchyTokenTokenID]);
}

TEST_F(HierarchyTokenTest, keepsTheTokenAndCountsTheLevelsBelowAParent) {
  const Dictionary root = *newHierarchyTokenFromParentToken(_random, {});
  const Dictionary child = *newHierarchyTokenFromParentToken(_random, root);
  const Dictionary grandchild = *newHierarchyTokenFromParentToken(_random, child);
  EXPECT_EQ(child[kTelvaneHierarchyTokenTokenID], root[kTelvaneHierarchyTokenTokenID]);
  EXPECT_EQ(grandchild[kTelvaneHierarchyTokenTokenID], root[kTelvaneHierarchyTokenTokenID]);
  EXPECT_EQ(child[kTelvaneHierarchyTokenLevel], Value(1));
  EXPECT_EQ(grandchild[kTelvaneHierarchyTokenLevel], Value(2));
}

TEST_F(HierarchyTokenTest, takesAMissingLevelForZero) {
  const Dictionary child = *newHierarchyTokenFromParentToken(_random, Dictionary{{kTelvaneHierarchyTokenTokenID, "t"}});
  EXPECT_EQ(child, (Dictionary{{kTelvaneHierarchyTokenTokenID, "t"}, {kTelvaneHierarchyTokenLevel, 1}}));
}

TEST_F(HierarchyTokenTest, refusesAParentThatIsNoDictionaryOrHasNoToken) {
  EXPECT_FALSE(newHierarchyTokenFromParentToken(_random, Array{1}).has_value());
  EXPECT_FALSE(newHierarchyTokenFromParentToken(_random, "token").has_value());
  EXPECT_FALSE(newHierarchyTokenFromParentToken(_random, Dictionary{{kTelvaneHierarchyTokenLevel, 1}}).has_value());
}

TEST_F(HierarchyTokenTest, survivesTheLargestLevel) {
  const Dictionary parent{{kTelvaneHierarchyTokenTokenID, "t"},
                          {kTelvaneHierarchyTokenLevel, std::numeric_limits<int32_t>::max()}};
  const Dictionary child = *newHierarchyTokenFromParentToken(_random, parent);
  EXPECT_EQ(child[kTelvaneHierarchyTokenLevel], Value(std::numeric_limits<int32_t>::min()));
}

}  // namespace
}  // namespace telvane::testing
