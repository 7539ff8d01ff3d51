#include "tests/support/Matchers.h"

#include <gtest/gtest-spi.h>
#include <gtest/gtest.h>

#include <cerrno>
#include <limits>

namespace telvane::testing {
namespace {

using ::testing::Not;
using ::testing::PrintToString;

constexpr Key kName{"name"};
constexpr Key kCount{"count"};

Error exampleError() { return Error::withDescription(kPlatformErrorDomain, EFBIG, "the file is too big"); }

// What a matcher says about a value that it does not match.
template <class T, class Matcher>
std::string explain(const T& value, const Matcher& matcher) {
  ::testing::StringMatchResultListener listener;
  ::testing::SafeMatcherCast<const T&>(matcher).MatchAndExplain(value, &listener);
  return listener.str();
}

TEST(MatchersTest, printsValuesWithTheirKinds) {
  EXPECT_EQ(PrintToString(Value()), "(absent)");
  EXPECT_EQ(PrintToString(Value(true)), "true");
  EXPECT_EQ(PrintToString(Value(1)), "1");
  EXPECT_EQ(PrintToString(Value(1.0)), "1.0");
  EXPECT_EQ(PrintToString(Value(std::numeric_limits<uint64_t>::max())), "18446744073709551615u");
  EXPECT_EQ(PrintToString(Value("text")), "\"text\"");
  EXPECT_EQ(PrintToString(Value(Data::copyOf("ab"))), "<6162>");
  EXPECT_EQ(PrintToString(Value(Date())), "1970-01-01 00:00:00 +0000");
  EXPECT_EQ(PrintToString(Value(Array{1, Array{}, "a"})), "[1, [], \"a\"]");
}

TEST(MatchersTest, printsDictionariesInTheirOrder) {
  const Dictionary dictionary{{kName, "x"}, {kCount, 2}, {Key("empty"), Dictionary()}};
  EXPECT_EQ(PrintToString(dictionary), "{name: \"x\", count: 2, empty: {}}");
  EXPECT_EQ(PrintToString(Value(dictionary)), PrintToString(dictionary));
}

TEST(MatchersTest, printsDeepValuesWithoutEnd) {
  Value value = 1;
  for (int depth = 0; depth < 1000; ++depth) value = Array{value};
  EXPECT_NE(PrintToString(value).find("[...]"), std::string::npos);
}

TEST(MatchersTest, printsTextKeysDatesAndIdentifiers) {
  EXPECT_EQ(PrintToString(String("text")), "\"text\"");
  EXPECT_EQ(PrintToString(kName), "\"name\"");
  EXPECT_EQ(PrintToString(Date::fromSecondsSince1970(0.25)), "1970-01-01 00:00:00 +0000 (.250000)");
  EXPECT_EQ(PrintToString(UUID()), "00000000-0000-0000-0000-000000000000");
}

TEST(MatchersTest, printsErrorsResultsAndRequests) {
  EXPECT_EQ(PrintToString(exampleError()), "TelvanePlatform 27 \"the file is too big\"");
  EXPECT_EQ(PrintToString(Result<Value>(Value(7))), "ok: 7");
  EXPECT_EQ(PrintToString(Result<void>()), "ok");
  EXPECT_EQ(PrintToString(Result<void>(exampleError())), "failed: TelvanePlatform 27 \"the file is too big\"");
  const URLRequest request{"https://a.example/", "POST", {{"A", "1"}}, Data::copyOf("xyz")};
  EXPECT_EQ(PrintToString(request), "POST https://a.example/\n  A: 1\n  and 3 bytes");
  EXPECT_EQ(PrintToString(URLResponse{404, {{"B", "2"}}, "https://a.example/"}), "404 from https://a.example/\n  B: 2");
}

TEST(MatchersTest, tellsOkFromAnError) {
  const Result<Value> good(Value(1));
  const Result<Value> bad(exampleError());
  EXPECT_TRUE(isOk(good));
  EXPECT_FALSE(isOk(bad));
  EXPECT_STREQ(isOk(bad).message(), "failed: TelvanePlatform 27 \"the file is too big\"");
  EXPECT_THAT(good, IsOk());
  EXPECT_THAT(bad, Not(IsOk()));
}

TEST(MatchersTest, tellsErrorsByCodeAndText) {
  const Result<Value> bad(exampleError());
  EXPECT_TRUE(isError(bad, EFBIG));
  EXPECT_TRUE(isError(bad, EFBIG, "too big"));
  EXPECT_STREQ(isError(bad, ENOENT).message(), "not code 2 but TelvanePlatform 27 \"the file is too big\"");
  EXPECT_STREQ(isError(bad, EFBIG, "small").message(), "no \"small\" in TelvanePlatform 27 \"the file is too big\"");
  EXPECT_STREQ(isError(Result<Value>(Value(1)), EFBIG).message(), "no error but ok: 1");
  EXPECT_THAT(bad, IsErrorCode(EFBIG));
  EXPECT_THAT(bad, Not(IsErrorCode(ENOENT)));
  EXPECT_THAT(Result<Value>(Value(1)), Not(IsErrorCode(EFBIG)));
}

TEST(MatchersTest, matchesAnErrorsCodeAlsoWhenItMayBeAbsent) {
  EXPECT_THAT(exampleError(), HasCode(EFBIG));
  EXPECT_THAT(std::optional<Error>(exampleError()), HasCode(EFBIG));
  EXPECT_THAT(std::optional<Error>(exampleError()), Not(HasCode(ENOENT)));
  EXPECT_THAT(std::optional<Error>(), Not(HasCode(EFBIG)));
}

TEST(MatchersTest, matchesAnEntryByKindAndValue) {
  const Dictionary dictionary{{kName, "x"}, {kCount, 1}};
  EXPECT_THAT(dictionary, HasEntry(kName, "x"));
  EXPECT_THAT(Value(dictionary), HasEntry(kCount, 1));
  EXPECT_THAT(dictionary, Not(HasEntry(kCount, true)));
  EXPECT_THAT(dictionary, Not(HasEntry("other", 1)));
  EXPECT_THAT(dictionary, HasEntry("other", Value()));
  EXPECT_THAT(Value(1), Not(HasEntry(kCount, 1)));
  EXPECT_EQ(explain(dictionary, HasEntry(kCount, 2)), "which has 1 there");
  EXPECT_EQ(explain(Value(1), HasEntry(kCount, 2)), "which is no dictionary");
}

TEST(MatchersTest, matchesAHeaderWithoutRegardToTheCaseOfItsName) {
  const URLRequest request{"https://a.example/", "GET", {{"Content-Type", "text/plain"}}};
  EXPECT_THAT(request, HasHeader("content-type", "text/plain"));
  EXPECT_THAT(request, Not(HasHeader("Content-Type", "TEXT/PLAIN")));
  EXPECT_THAT(request, Not(HasHeader("Accept", "")));
  EXPECT_EQ(explain(request, HasHeader("Accept", "x")), "which has no such header");
  EXPECT_EQ(explain(request, HasHeader("Content-Type", "x")), "whose value is \"text/plain\"");
}

TEST(MatchersTest, showsTheWholeLogWhenALineIsMissing) {
  RecordingLog log;
  EXPECT_STREQ(hasLine(log, "x").message(), "no line contains \"x\":\n(the log is empty)\n");
  log.message("present");
  log.info("present too");
  EXPECT_TRUE(hasLine(log, "present"));
  EXPECT_TRUE(hasLine(log, LogLevel::Info, "too"));
  EXPECT_FALSE(hasLine(log, LogLevel::Error, "present"));
  EXPECT_TRUE(hasNoLine(log, "absent"));
  EXPECT_FALSE(hasNoLine(log, "present"));
  EXPECT_TRUE(hasLines(log, 2, "present"));
  EXPECT_STREQ(hasLines(log, 1, "present").message(),
               "2 lines, not 1, contain \"present\":\n"
               "0.000000 test <default> present\n0.000000 test <info> present too\n");
}

}  // namespace
}  // namespace telvane::testing
