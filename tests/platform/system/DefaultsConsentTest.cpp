#include "platform/system/DefaultsConsent.h"

#include <gtest/gtest.h>

#include "tests/platform/system/Expect.h"
#include "tests/support/MemoryUserDefaults.h"
#include "tests/support/RecordingLog.h"

namespace telvane {
namespace {

using telvane::testing::RecordingLog;
using telvane::testing::succeeds;

class DefaultsConsentTest : public ::testing::Test {
 protected:
  void givenSetting(const Value& value) {
    ASSERT_TRUE(succeeds(_defaults.setObject("com.corvex.diagnostics", "AutoSubmit", value)));
  }

  testing::MemoryUserDefaults _defaults;
  RecordingLog _log;
  DefaultsConsent _consent{_defaults, _log};
};

TEST_F(DefaultsConsentTest, takesNoAnswerForNo) { EXPECT_FALSE(_consent.isSubmissionAllowed()); }

TEST_F(DefaultsConsentTest, followsTheUsersAnswerAsItChanges) {
  givenSetting(true);
  EXPECT_TRUE(_consent.isSubmissionAllowed());
  givenSetting(false);
  EXPECT_FALSE(_consent.isSubmissionAllowed());
}

TEST_F(DefaultsConsentTest, takesAnythingButABooleanForNoWithOneErrorLine) {
  _log.expectError("AutoSubmit");
  for (const Value& value : {Value(1), Value("YES"), Value(1.0), Value(Array{true})}) {
    givenSetting(value);
    EXPECT_FALSE(_consent.isSubmissionAllowed()) << description(value);
  }
  EXPECT_EQ(_log.count(LogLevel::Error, ""), 1u);
}

}  // namespace
}  // namespace telvane
