#include "interfaces/ErrorCoding.h"

#include <gtest/gtest.h>

#include "foundation/Description.h"
#include "interfaces/TelvaneErrors.h"

namespace telvane::testing {
namespace {

TEST(ErrorCodingTest, bringsAnErrorBackAsItWas) {
  const Error withText = makeTelvaneError("No backends available to send message", -1);
  EXPECT_EQ(errorcoding::decode(errorcoding::encode(withText)), withText);
  const Error bare("a domain", 503);
  EXPECT_EQ(errorcoding::decode(errorcoding::encode(bare)), bare);
}

TEST(ErrorCodingTest, travelsAsADictionaryOfThree) {
  EXPECT_EQ(errorcoding::encode(makeTelvaneError("text", 4)),
            Value(Dictionary{{Key("domain"), "TelvaneErrorDomain"},
                             {Key("code"), 4},
                             {Key("userInfo"), Dictionary{{Error::kLocalizedDescription, "text"}}}}));
}

TEST(ErrorCodingTest, takesNothingForNoError) {
  EXPECT_FALSE(errorcoding::encode(std::nullopt).isPresent());
  EXPECT_FALSE(errorcoding::decode(Value()).has_value());
}

TEST(ErrorCodingTest, takesAnythingElseForAnError) {
  for (const Value& odd : {Value("text"), Value(0), Value(Array{1}), Value(Dictionary()),
                           Value(Dictionary{{Key("domain"), 1}, {Key("userInfo"), "none"}})}) {
    const std::optional<Error> error = errorcoding::decode(odd);
    ASSERT_TRUE(error.has_value()) << description(odd);
    EXPECT_EQ(*error, Error()) << description(odd);
  }
}

}  // namespace
}  // namespace telvane::testing
