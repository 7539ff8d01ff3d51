#include "platform/FlowGate.h"

#include <gtest/gtest.h>

namespace telvane::testing {
namespace {

TEST(FlowGateTest, isOpenUpToItsLimitAndClosedAboveIt) {
  FlowGate gate(100);
  gate.add(100);
  EXPECT_TRUE(gate.isOpen());
  gate.add(1);
  EXPECT_FALSE(gate.isOpen());
  EXPECT_EQ(gate.bytes(), 101u);
  gate.subtract(1);
  EXPECT_TRUE(gate.isOpen());
}

TEST(FlowGateTest, runsAJobAtOnceWhileItIsOpen) {
  FlowGate gate(100);
  bool hasRun = false;
  gate.whenOpen([&] { hasRun = true; });
  EXPECT_TRUE(hasRun);
}

TEST(FlowGateTest, runsWhatWaitsInOrderWhenItOpensAndOnlyOnce) {
  FlowGate gate(100);
  gate.add(150);
  std::string order;
  gate.whenOpen([&] { order += "a"; });
  gate.whenOpen([&] { order += "b"; });
  gate.subtract(49);
  EXPECT_EQ(order, "") << "101 bytes are above the limit of 100";
  gate.subtract(1);
  EXPECT_EQ(order, "ab");
  gate.add(50);
  gate.subtract(50);
  EXPECT_EQ(order, "ab");
}

TEST(FlowGateTest, letsAJobThatRunsAskForTheNextOpening) {
  FlowGate gate(100);
  gate.add(101);
  int openings = 0;
  gate.whenOpen([&] {
    ++openings;
    gate.add(50);
    gate.whenOpen([&] { ++openings; });
  });
  gate.subtract(1);
  EXPECT_EQ(openings, 1);
  gate.subtract(50);
  EXPECT_EQ(openings, 2);
}

TEST(FlowGateTest, neverHoldsLessThanNothing) {
  FlowGate gate(100);
  gate.add(10);
  gate.subtract(20);
  EXPECT_EQ(gate.bytes(), 0u);
  gate.add(101);
  EXPECT_FALSE(gate.isOpen());
}

}  // namespace
}  // namespace telvane::testing
