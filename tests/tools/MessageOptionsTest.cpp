#include "tools/MessageOptions.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "interfaces/SessionKeys.h"
#include "tests/support/Matchers.h"

namespace telvane::testing {
namespace {

TEST(MessageOptionsTest, makesTheSessionInfoOfAClient) {
  MessageOptions options;
  options.clientType = 22;
  const Dictionary info = options.makeSessionInfo(5).value();
  EXPECT_THAT(info, HasEntry(kTelvaneSessionInfoClientType.view(), 22));
  EXPECT_THAT(info, HasEntry(kTelvaneSessionInfoSessionID.view(), 5));
  EXPECT_THAT(info, HasEntry(kTelvaneSessionInfoBatchEvent.view(), false));
  EXPECT_THAT(info, HasEntry(kTelvaneSessionInfoRequireUserInfo.view(), false));
  EXPECT_FALSE(options.makeUserInfo().value().isPresent());
}

TEST(MessageOptionsTest, batchesWhatIsFlushedAndRequiresTheUserInfoThatIsGiven) {
  MessageOptions options;
  options.isFlushing = true;
  options.serviceName = "steps";
  const Dictionary info = options.makeSessionInfo(1).value();
  EXPECT_THAT(info, HasEntry(kTelvaneSessionInfoBatchEvent.view(), true));
  EXPECT_THAT(info, HasEntry(kTelvaneSessionInfoRequireUserInfo.view(), true));
  EXPECT_THAT(options.makeUserInfo().value(), HasEntry(kTelvaneUserInfoServiceName.view(), "steps"));
}

TEST(MessageOptionsTest, laysTheGivenDictionariesOverWhatTheOthersMake) {
  MessageOptions options;
  options.clientType = 7;
  options.clientName = "me";
  options.sessionInfo = R"({"ComponentType": "seven", "EnableFlag": 0})";
  options.userInfo = R"({"_clientName": 5, "more": true})";
  const Dictionary info = options.makeSessionInfo(1).value();
  EXPECT_THAT(info, HasEntry("ComponentType", "seven"));
  EXPECT_THAT(info, HasEntry("EnableFlag", 0));
  const Value userInfo = options.makeUserInfo().value();
  EXPECT_THAT(userInfo, HasEntry("_clientName", 5));
  EXPECT_THAT(userInfo, HasEntry("more", true));
}

TEST(MessageOptionsTest, makesAMessageWithThePayloadThatIsGiven) {
  MessageOptions options;
  options.category = 12;
  options.type = 3;
  options.flag = 1;
  EXPECT_FALSE(options.makeMessage().value().contains(kTelvaneMessageParametersPayload));
  options.payload = R"({"frames": 30})";
  const Dictionary message = options.makeMessage().value();
  EXPECT_THAT(message, HasEntry(kTelvaneMessageParametersCategory.view(), 12));
  EXPECT_THAT(message, HasEntry(kTelvaneMessageParametersType.view(), 3));
  EXPECT_THAT(message, HasEntry(kTelvaneMessageParametersFlag.view(), 1));
  EXPECT_THAT(message[kTelvaneMessageParametersPayload], HasEntry("frames", 30));
}

TEST(MessageOptionsTest, refusesTextThatIsNoJSONObjectAndNamesTheOption) {
  for (const char* text : {"[]", "5", "{", "frames=30"}) {
    MessageOptions options;
    options.payload = options.sessionInfo = options.userInfo = text;
    ASSERT_TRUE(options.makeMessage().has_error()) << text;
    EXPECT_THAT(options.makeMessage().error().description(), ::testing::HasSubstr("--payload"));
    ASSERT_TRUE(options.makeSessionInfo(1).has_error()) << text;
    EXPECT_THAT(options.makeSessionInfo(1).error().description(), ::testing::HasSubstr("--session-info"));
    ASSERT_TRUE(options.makeUserInfo().has_error()) << text;
    EXPECT_THAT(options.makeUserInfo().error().description(), ::testing::HasSubstr("--user-info"));
  }
}

TEST(MessageOptionsTest, readsTheDigestKeyAsHexadecimal) {
  MessageOptions options;
  EXPECT_FALSE(options.makeDigestKey().value().isPresent());
  options.digestKey = "00fFa1";
  EXPECT_EQ(options.makeDigestKey().value(), Value(Data::copyOf(std::string_view("\x00\xff\xa1", 3))));
  for (const char* text : {"0", "0g", "xx", "0x12", "-1", "+1", "1 "}) {
    options.digestKey = text;
    EXPECT_TRUE(options.makeDigestKey().has_error()) << text;
  }
}

}  // namespace
}  // namespace telvane::testing
