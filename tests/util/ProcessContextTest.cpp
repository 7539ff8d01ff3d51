#include "util/ProcessContext.h"

#include <gtest/gtest.h>

#include "interfaces/DefaultsKeys.h"
#include "tests/support/Matchers.h"
#include "tests/support/SimulatedWorld.h"
#include "util/UserDefaultsEnvironment.h"

namespace telvane::testing {
namespace {

class ProcessContextTest : public ::testing::Test {
 protected:
  ProcessContext context() { return ProcessContext(process.platform()); }
  uint32_t environmentFor(Value stored) {
    EXPECT_TRUE(
        isOk(process.userDefaults().setObject(kTelvaneDefaultsSuite.view(), kDefaultsEnvironmentType.view(), stored)));
    return userDefaultsEnvironment(context());
  }
  SimulatedWorld world;
  SimulatedPlatform& process = world.makeProcess("telvaned");
};

TEST_F(ProcessContextTest, isInternalWhenTheReleaseTypeSaysSo) {
  EXPECT_FALSE(context().isInternalBuild());
  process.deviceAnswers().set("ReleaseType", "internal");
  EXPECT_FALSE(context().isInternalBuild());
  process.deviceAnswers().set("ReleaseType", "Internal");
  EXPECT_TRUE(context().isInternalBuild());
}

TEST_F(ProcessContextTest, theBuildIsAskedForOnce) {
  process.deviceAnswers().set("ReleaseType", "Internal");
  const ProcessContext made(process.platform());
  process.deviceAnswers().remove("ReleaseType");
  EXPECT_TRUE(made.isInternalBuild());
}

TEST_F(ProcessContextTest, itsInstanceIdentifierIsMadeOncePerProcess) {
  const ProcessContext made(process.platform());
  EXPECT_EQ(made.processInstanceIdentifier().size(), 36u);
  EXPECT_EQ(made.processInstanceIdentifier(), made.processInstanceIdentifier());
  EXPECT_NE(made.processInstanceIdentifier(), context().processInstanceIdentifier());
}

TEST_F(ProcessContextTest, theFrameworkVersionFallsBackTo8) {
  EXPECT_EQ(context().clientFrameworkVersion(), "1.0");
  process.clientBundle().setVersion(std::nullopt);
  EXPECT_EQ(context().clientFrameworkVersion(), "8.0");
}

TEST_F(ProcessContextTest, theEnvironmentFollowsTheDefaultsElseTheBuild) {
  for (uint32_t type = 0; type <= 4; ++type) EXPECT_EQ(environmentFor(type), type);
  EXPECT_EQ(environmentFor(Value()), kEnvironmentTypeRelease);
  process.deviceAnswers().set("ReleaseType", "Internal");
  EXPECT_EQ(environmentFor(Value()), kEnvironmentTypeInternal);
  EXPECT_EQ(environmentFor("3"), kEnvironmentTypeSeed);
}

TEST_F(ProcessContextTest, anEnvironmentOf5OrMoreIsAnErrorAndInternal) {
  process.log().expectError("userDefaultsEnvironment: Invalid environment type 5");
  process.log().expectError("userDefaultsEnvironment: Invalid environment type 4294967295");
  EXPECT_EQ(environmentFor(5), kEnvironmentTypeInternal);
  EXPECT_EQ(environmentFor(-1), kEnvironmentTypeInternal);
}

TEST(EnvironmentNamesTest, areTheSectionsKeys) {
  EXPECT_EQ(environmentNameForType(0), "");
  EXPECT_EQ(environmentNameForType(1), "development");
  EXPECT_EQ(environmentNameForType(2), "corvex_internal");
  EXPECT_EQ(environmentNameForType(3), "seed");
  EXPECT_EQ(environmentNameForType(4), "release");
  EXPECT_EQ(environmentNameForType(5), "");
}

}  // namespace
}  // namespace telvane::testing
