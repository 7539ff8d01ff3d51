#include "tests/support/MemoryUserDefaults.h"

#include <gtest/gtest.h>

#include <cerrno>

#include "tests/support/CountingTransactions.h"
#include "tests/support/FixedDeviceAnswers.h"
#include "tests/support/Matchers.h"

namespace telvane::testing {
namespace {

constexpr char kSuite[] = "com.example.suite";

TEST(MemoryUserDefaultsTest, putsTheUsersValuesOverTheSystemsOnes) {
  MemoryUserDefaults defaults;
  defaults.setSystemWide(kSuite, "both", "system");
  defaults.setSystemWide(kSuite, "system", 1);
  EXPECT_TRUE(isOk(defaults.setObject(kSuite, "both", "user")));
  EXPECT_EQ(defaults.objectForKey(kSuite, "both"), Value("user"));
  EXPECT_EQ(defaults.objectForKey(kSuite, "system"), Value(1));
  EXPECT_EQ(defaults.dictionaryRepresentation(kSuite), (Dictionary{{"both", "user"}, {"system", 1}}));
  EXPECT_EQ(defaults.objectForKey("other", "both"), Value());
}

TEST(MemoryUserDefaultsTest, removesAKeyThatIsSetToNothing) {
  MemoryUserDefaults defaults;
  EXPECT_TRUE(isOk(defaults.setObject(kSuite, "key", 1)));
  EXPECT_TRUE(isOk(defaults.setObject(kSuite, "key", Value())));
  EXPECT_TRUE(defaults.dictionaryRepresentation(kSuite).empty());
}

TEST(MemoryUserDefaultsTest, storesAMadeValueOnlyWhereThereIsNone) {
  MemoryUserDefaults defaults;
  EXPECT_EQ(defaults.objectForKeyOrStore(kSuite, "key", [] { return Value("made"); }), Value("made"));
  EXPECT_EQ(defaults.objectForKeyOrStore(kSuite, "key", [] { return Value("again"); }), Value("made"));
}

TEST(MemoryUserDefaultsTest, failsWritesUntilToldOtherwise) {
  MemoryUserDefaults defaults;
  defaults.failWrites(ENOSPC);
  EXPECT_TRUE(isError(defaults.setObject(kSuite, "key", 1), ENOSPC));
  EXPECT_EQ(defaults.objectForKeyOrStore(kSuite, "key", [] { return Value("made"); }), Value("made"));
  EXPECT_EQ(defaults.objectForKey(kSuite, "key"), Value());
  defaults.failWrites(std::nullopt);
  EXPECT_TRUE(isOk(defaults.setObject(kSuite, "key", 1)));
}

TEST(CountingTransactionsTest, countsBeginsAndEnds) {
  CountingTransactions transactions;
  transactions.begin();
  transactions.begin();
  transactions.end();
  EXPECT_EQ(transactions.open(), 1);
  EXPECT_EQ(transactions.begun(), 2);
  transactions.end();
  transactions.end();
  EXPECT_EQ(transactions.open(), 0);
  EXPECT_EQ(transactions.surplusEnds(), 1);
}

TEST(FixedDeviceAnswersTest, answersWhatItWasGiven) {
  FixedDeviceAnswers device{{"SerialNumber", "1"}};
  EXPECT_EQ(device.answer(DeviceAnswers::kSerialNumber), String("1"));
  EXPECT_EQ(device.answer(DeviceAnswers::kDeviceName), std::nullopt);
  device.set(DeviceAnswers::kDeviceName, "name");
  device.remove(DeviceAnswers::kSerialNumber);
  EXPECT_EQ(device.answer(DeviceAnswers::kDeviceName), String("name"));
  EXPECT_EQ(device.answer(DeviceAnswers::kSerialNumber), std::nullopt);
}

}  // namespace
}  // namespace telvane::testing
