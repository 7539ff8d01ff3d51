#include "client/UpdateAndReportServices.h"

#include <gtest/gtest.h>

#include "tests/support/Matchers.h"

namespace telvane::testing {
namespace {

TEST(UpdateAndReportServicesTest, keepsWhatAModuleWantsToBeCalledFor) {
  for (const bool isUpdated : {false, true}) {
    for (const bool isReporting : {false, true}) {
      const UpdateAndReportServices services(isUpdated, isReporting, [](Dictionary*) {});
      EXPECT_EQ(services.update(), isUpdated);
      EXPECT_EQ(services.report(), isReporting);
    }
  }
}

TEST(UpdateAndReportServicesTest, replacesItsBlockWhileAnEarlierOneIsInUse) {
  int which = 0;
  UpdateAndReportServices services(true, true, [&](Dictionary*) { which = 1; });
  const auto first = services.block();
  services.setBlock([&](Dictionary*) { which = 2; });
  (*first)(nullptr);
  EXPECT_EQ(which, 1);
  (*services.block())(nullptr);
  EXPECT_EQ(which, 2);
}

TEST(UpdateAndReportServicesTest, letsItsBlockGoWithItself) {
  auto held = std::make_shared<int>(0);
  const std::weak_ptr<int> observer = held;
  auto services = std::make_unique<UpdateAndReportServices>(true, true, [held = std::move(held)](Dictionary*) {});
  EXPECT_FALSE(observer.expired());
  services.reset();
  EXPECT_TRUE(observer.expired());
}

// The block that goes may call back; no lock is held then.
TEST(UpdateAndReportServicesTest, mayBeAskedWhileAnEarlierBlockGoes) {
  UpdateAndReportServices services(true, true, [](Dictionary*) {});
  bool isAsked = false;
  {
    const std::shared_ptr<int> held(new int(0), [&](int* number) {
      isAsked = services.block() != nullptr;
      const std::unique_ptr<int> owned(number);
    });
    services.setBlock([held](Dictionary*) {});
  }
  EXPECT_FALSE(isAsked);
  services.setBlock([](Dictionary*) {});
  EXPECT_TRUE(isAsked);
}

}  // namespace
}  // namespace telvane::testing
