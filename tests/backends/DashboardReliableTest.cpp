// What is sent again and when, what an acknowledgement does, and how a backend ends.
#include <gmock/gmock.h>

#include <cerrno>

#include "tests/backends/DashboardFixture.h"

namespace telvane::testing {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;

constexpr int kMoreThanTheSchedule = 40;  // periods
constexpr char kLastResortLine[] = "DashboardBackend(myPeriodicTask): scheduled last resort clean-up in 9500 ms.";
constexpr char kCleanedUpLine[] = "DashboardBackend(myPeriodicTask): clean up at myPeriodicTask.";

class DashboardReliableTest : public DashboardFixture {
 protected:
  DashboardReliableTest() {
    givenReliable();
    make();
  }
  size_t arrivals() { return dashboard().arrivals().size(); }
  // Periods of the transmissions of one event.
  std::vector<int64_t> periodsOf(uint16_t eventID) {
    std::vector<int64_t> periods;
    for (const auto& arrival : dashboard().arrivals()) {
      if (eventIDOf(arrival.bytes) != eventID) continue;
      periods.push_back((arrival.at - SimulatedScheduler::kStart) / kPeriod);
    }
    return periods;
  }
  // That the dashboard hears no more of the events.
  void expectSilence() {
    const size_t before = arrivals();
    tick(kMoreThanTheSchedule);
    EXPECT_EQ(arrivals(), before);
  }
};

class DashboardUnreliableTest : public DashboardFixture {
 protected:
  DashboardUnreliableTest() { make(); }
  // The period is the usual one.
  void tick(int periods = 1) { _world.advance(std::chrono::milliseconds(500) * periods); }
};

TEST_F(DashboardReliableTest, sendsFiveTimesInAll) {
  send({});
  tick(kMoreThanTheSchedule);
  EXPECT_THAT(arrivalPeriods(), ElementsAre(0, 2, 5, 10, 19));
}

TEST_F(DashboardReliableTest, sendsTheSameBytesAgain) {
  send({{Key("k"), "v"}});
  tick(kMoreThanTheSchedule);
  ASSERT_EQ(arrivals(), 5u);
  for (const auto& arrival : dashboard().arrivals()) EXPECT_EQ(arrival.bytes, dashboard().arrivals().front().bytes);
}

TEST_F(DashboardReliableTest, givesUpAtPeriod20) {
  send({});
  tick(19);
  EXPECT_EQ(arrivals(), 5u);
  // Still waited for, so that cleanup has to wait.
  std::weak_ptr<DashboardBackend> weak = _backend;
  cleanupAndLetGo();
  EXPECT_FALSE(weak.expired());
  tick();
  EXPECT_TRUE(hasLine(log(), kCleanedUpLine));
  EXPECT_EQ(network().openSockets(), 0u);
  tick(2);
  EXPECT_TRUE(weak.expired()) << "a job held it so long";
}

TEST_F(DashboardReliableTest, countsFromTheTickBeforeTheEvent) {
  _world.advance(kPeriod / 2);
  send({});
  tick(kMoreThanTheSchedule);
  EXPECT_THAT(arrivalPeriods(), ElementsAre(0, 2, 5, 10, 19));
}

TEST_F(DashboardReliableTest, sendsNothingAgainOnceItIsAcknowledged) {
  send({});
  acknowledge(1);
  expectSilence();
  EXPECT_EQ(arrivals(), 1u);
}

// An acknowledgement may come at any time of the schedule.
class DashboardAcknowledgedTest : public DashboardReliableTest, public ::testing::WithParamInterface<int> {};

TEST_P(DashboardAcknowledgedTest, sendsNothingAgainWheneverThatIs) {
  send({});
  tick(GetParam());
  acknowledge(1);
  _world.runUntilIdle();
  expectSilence();
}

INSTANTIATE_TEST_SUITE_P(Periods, DashboardAcknowledgedTest, ::testing::Range(0, 21));

TEST_F(DashboardReliableTest, anAcknowledgementIsForItsEventAlone) {
  sendMany(3);
  acknowledge(2);
  tick(kMoreThanTheSchedule);
  EXPECT_THAT(periodsOf(1), SizeIs(5));
  EXPECT_THAT(periodsOf(2), SizeIs(1));
  EXPECT_THAT(periodsOf(3), SizeIs(5));
}

TEST_F(DashboardReliableTest, takesAcknowledgementsInAnyOrderAndMoreThanOnce) {
  sendMany(4);
  for (const uint16_t eventID : {4, 1, 4, 3, 3, 2, 1}) acknowledge(eventID);
  expectSilence();
  EXPECT_EQ(arrivals(), 4u);
}

TEST_F(DashboardReliableTest, anAcknowledgementEndsTheOldestOfEqualEvents) {
  for (const char* text : {"old", "new"}) {
    backend().sendMessage(Dictionary{{Key("k"), text}}, Date(), uint16_t{1}, uint16_t{1}, uint16_t{9});
  }
  _world.runUntilIdle();
  acknowledge(9);
  tick(2);
  EXPECT_EQ(lastTextAt(dashboard()), " k=new");
  EXPECT_EQ(arrivals(), 3u);
  acknowledge(9);
  expectSilence();
}

TEST_F(DashboardReliableTest, anAcknowledgementOfAnUnknownEventDoesNothing) {
  send({});
  for (const uint16_t eventID : {0, 2, 256, 65535}) acknowledge(eventID);
  tick(2);
  EXPECT_EQ(arrivals(), 2u);
}

TEST_F(DashboardReliableTest, anAcknowledgementWithoutItsBytesDoesNothing) {
  // Event 0 is what missing bytes would read as.
  backend().sendMessage(Dictionary(), Date(), uint16_t{1}, uint16_t{1}, uint16_t{0});
  backend().sendMessage(Dictionary(), Date(), uint16_t{1}, uint16_t{1}, uint16_t{256});
  _world.runUntilIdle();
  for (const size_t length : {0, 1, 2, 59, 60, 61}) {
    dashboard().answer(sender(), acknowledgementOf(0, length));
    dashboard().answer(sender(), acknowledgementOf(256, length));
  }
  tick(2);
  EXPECT_EQ(arrivals(), 4u);
  acknowledge(0);
  acknowledge(256);
  expectSilence();
}

TEST_F(DashboardReliableTest, anAcknowledgementMayBeLongerThanAnyDatagram) {
  sendMany(3);
  dashboard().answer(sender(), acknowledgementOf(1, 64));
  dashboard().answer(sender(), acknowledgementOf(2, 1088));
  dashboard().answer(sender(), acknowledgementOf(3, 60000));
  expectSilence();
  EXPECT_EQ(arrivals(), 3u);
}

TEST_F(DashboardReliableTest, doesNotHearOtherAddresses) {
  send({});
  network().serve("192.0.2.8", kPort).answer(sender(), acknowledgementOf(1));
  network().serve(kIP, kPort + 1).answer(sender(), acknowledgementOf(1));
  tick(2);
  EXPECT_EQ(arrivals(), 2u);
}

TEST_F(DashboardReliableTest, whatGotLostComesAgain) {
  dashboard().loseNext(3);
  dashboard().onArrival([this](const auto& arrival) {
    dashboard().answer(arrival.from, acknowledgementOf(eventIDOf(arrival.bytes)), std::chrono::milliseconds(30));
  });
  send({});
  tick(kMoreThanTheSchedule);
  EXPECT_THAT(arrivalPeriods(), ElementsAre(10));
}

TEST_F(DashboardReliableTest, aLostAcknowledgementMakesARepetition) {
  int asked = 0;
  dashboard().onArrival([this, &asked](const auto& arrival) {
    if (++asked == 2) dashboard().answer(arrival.from, acknowledgementOf(eventIDOf(arrival.bytes)));
  });
  send({});
  tick(kMoreThanTheSchedule);
  EXPECT_THAT(arrivalPeriods(), ElementsAre(0, 2));
}

TEST_F(DashboardReliableTest, the51stPacketDropsTheOldest) {
  sendMany(51);
  EXPECT_EQ(arrivals(), 51u);
  dashboard().clear();
  tick(2);
  ASSERT_EQ(arrivals(), 50u);
  EXPECT_EQ(eventIDOf(dashboard().arrivals().front().bytes), 2);
  EXPECT_EQ(eventIDOf(dashboard().arrivals().back().bytes), 51);
}

TEST_F(DashboardReliableTest, fiftyPacketsAreKept) {
  sendMany(50);
  dashboard().clear();
  tick(2);
  EXPECT_EQ(arrivals(), 50u);
}

TEST_F(DashboardReliableTest, triesWhatCouldNotBeSentEachPeriodAndCountsFromThere) {
  network().faults().sends = {-EAGAIN, -EAGAIN, 10};
  send({});
  tick(kMoreThanTheSchedule);
  EXPECT_THAT(arrivalPeriods(), ElementsAre(3, 5, 8, 13, 22));
}

TEST_F(DashboardReliableTest, aPartOfADatagramCountsAsNotSent) {
  network().faults().sends = {63};
  send({});
  EXPECT_EQ(arrivals(), 0u);
  tick();
  EXPECT_EQ(arrivals(), 1u);
}

TEST_F(DashboardReliableTest, aRetransmissionThatFailsIsTriedAtTheNextTick) {
  send({});
  tick();
  network().faults().sends = {-EAGAIN, 5};
  tick(kMoreThanTheSchedule);
  EXPECT_THAT(arrivalPeriods(), ElementsAre(0, 4, 7, 12, 21));
}

TEST_F(DashboardReliableTest, anUnsentPacketIsAcknowledgedToo) {
  network().faults().sends = {-EAGAIN};
  send({});
  dashboard().answer({{198, 51, 100, 1}, 40000}, acknowledgementOf(1));
  expectSilence();
  EXPECT_EQ(arrivals(), 0u);
}

TEST_F(DashboardReliableTest, bearsADashboardThatIsNotThere) {
  network().refuse("192.0.2.9", kPort);
  _profile.set(kProfileIP, "192.0.2.9");
  make();
  const size_t before = network().datagramsSent();
  sendMany(5);
  tick(3 * kMoreThanTheSchedule);
  EXPECT_GT(network().datagramsSent(), before);
  cleanupAndLetGo();
  _world.advance(std::chrono::seconds(10));
  EXPECT_EQ(network().openSockets(), 0u) << "of the two backends of this test";
}

TEST_F(DashboardUnreliableTest, keepsNothingThatWasSent) {
  sendMany(60);
  tick(kMoreThanTheSchedule);
  EXPECT_EQ(dashboard().arrivals().size(), 60u);
  cleanupAndLetGo();
  EXPECT_EQ(network().openSockets(), 0u) << "nothing to wait for";
}

TEST_F(DashboardUnreliableTest, triesWhatCouldNotBeSentUntilItIsOut) {
  network().faults().sends = {-EAGAIN, 12, -EAGAIN};
  send({});
  tick(2);
  EXPECT_THAT(dashboard().arrivals(), IsEmpty());
  tick();
  EXPECT_THAT(dashboard().arrivals(), SizeIs(1));
  tick(kMoreThanTheSchedule);
  EXPECT_THAT(dashboard().arrivals(), SizeIs(1));
}

TEST_F(DashboardUnreliableTest, keepsAtMost50ThatCouldNotBeSent) {
  network().faults().sends.assign(60, -EAGAIN);
  sendMany(60);
  tick();
  ASSERT_THAT(dashboard().arrivals(), SizeIs(50));
  EXPECT_EQ(eventIDOf(dashboard().arrivals().front().bytes), 11);
}

TEST_F(DashboardUnreliableTest, doesNotListen) {
  network().faults().sends = {-EAGAIN};
  send({});
  dashboard().answer({{198, 51, 100, 1}, 40000}, acknowledgementOf(1));
  tick();
  EXPECT_THAT(dashboard().arrivals(), SizeIs(1)) << "the acknowledgement is not read";
}

TEST_F(DashboardReliableTest, isCleanedUpAtOnceWhenNothingWaits) {
  send({});
  acknowledge(1);
  _world.runUntilIdle();
  const std::weak_ptr<DashboardBackend> weak = _backend;
  cleanupAndLetGo();
  EXPECT_TRUE(weak.expired());
  EXPECT_EQ(network().openSockets(), 0u);
  EXPECT_TRUE(hasNoLine(log(), "clean up"));
}

TEST_F(DashboardReliableTest, waitsForItsAcknowledgementsWhenItIsCleanedUp) {
  sendMany(2);
  const IPv4SocketAddress from = sender();
  cleanupAndLetGo();
  EXPECT_EQ(network().openSockets(), 1u);
  tick();
  EXPECT_TRUE(hasLines(log(), 1, kLastResortLine));
  dashboard().answer(from, acknowledgementOf(1));
  tick();
  EXPECT_EQ(network().openSockets(), 1u);
  EXPECT_EQ(arrivals(), 3u) << "event 2 came again";
  dashboard().answer(from, acknowledgementOf(2));
  _world.runUntilIdle();
  EXPECT_EQ(network().openSockets(), 1u) << "the tick looks";
  tick();
  EXPECT_EQ(network().openSockets(), 0u);
  EXPECT_TRUE(hasLines(log(), 1, kCleanedUpLine));
  EXPECT_TRUE(hasLines(log(), 1, kLastResortLine));
  expectSilence();
}

TEST_F(DashboardReliableTest, isCleanedUp9500MillisecondsAfterTheNextTickWhateverHappens) {
  _profile.set(kProfileReliable, 5000);
  make();
  _world.advance(std::chrono::milliseconds(1000));
  send({});
  cleanupAndLetGo();
  _world.advance(std::chrono::milliseconds(3999));
  EXPECT_TRUE(hasNoLine(log(), kLastResortLine));
  _world.advance(std::chrono::milliseconds(1));
  EXPECT_TRUE(hasLines(log(), 1, kLastResortLine));
  _world.advance(std::chrono::milliseconds(9499));
  EXPECT_EQ(network().openSockets(), 1u);
  _world.advance(std::chrono::milliseconds(1));
  EXPECT_EQ(network().openSockets(), 0u);
  EXPECT_TRUE(hasLines(log(), 1, kLastResortLine));
  EXPECT_TRUE(hasNoLine(log(), kCleanedUpLine));
  expectSilence();
}

TEST_F(DashboardReliableTest, isGoneForGoodBehindItsLastResort) {
  send({});
  const std::weak_ptr<DashboardBackend> weak = _backend;
  cleanupAndLetGo();
  _world.advance(std::chrono::seconds(11));
  EXPECT_TRUE(weak.expired());
}

TEST_F(DashboardReliableTest, takesCleanupMoreThanOnce) {
  send({});
  backend().cleanup();
  backend().cleanup();
  tick();
  backend().cleanup();
  tick(kMoreThanTheSchedule);
  EXPECT_TRUE(hasLines(log(), 1, kLastResortLine));
  backend().cleanup();
  cleanupAndLetGo();
  EXPECT_EQ(network().openSockets(), 0u);
}

TEST_F(DashboardReliableTest, sendsNothingOnceItIsCleanedUp) {
  backend().cleanup();
  _world.runUntilIdle();
  EXPECT_TRUE(send({}).has_value()) << "the line is the client's";
  expectSilence();
  EXPECT_EQ(arrivals(), 0u);
  EXPECT_EQ(network().openSockets(), 0u);
}

TEST_F(DashboardReliableTest, stopsWhenItIsLetGoOfWithoutCleanup) {
  sendMany(3);
  letGo();
  _world.runUntilIdle();
  EXPECT_EQ(network().openSockets(), 0u);
  expectSilence();
}

TEST_F(DashboardReliableTest, holdsATransactionUntilEachEventWasTriedOnce) {
  const auto& transactions = _process.transactions();
  backend().sendMessage(Dictionary(), Date(), uint16_t{1}, uint16_t{1}, uint16_t{1});
  backend().sendMessage(Dictionary(), Date(), uint16_t{1}, uint16_t{1}, uint16_t{2});
  EXPECT_EQ(transactions.open(), 2);
  cleanupAndLetGo();
  EXPECT_EQ(arrivals(), 2u);
  EXPECT_EQ(transactions.open(), 0) << "nobody waits for acknowledgements";
  EXPECT_EQ(transactions.surplusEnds(), 0);
}

TEST_F(DashboardReliableTest, repeatsNothingThatWasAcknowledgedInWhateverOrder) {
  _world.scheduler().setInterleaving(SimulatedScheduler::Interleaving::AtCalls);
  dashboard().onArrival([this](const auto& arrival) {
    const uint16_t eventID = eventIDOf(arrival.bytes);
    if (eventID % 3 != 0)
      dashboard().answer(arrival.from, acknowledgementOf(eventID), kPeriod * (eventID % 5) + kPeriod / 2);
  });
  sendMany(40);
  tick(kMoreThanTheSchedule);
  for (uint16_t eventID = 1; eventID <= 40; ++eventID) {
    // Of those that are acknowledged, what takes half a period, or one and a half, comes before the first repetition.
    const size_t expected = eventID % 3 == 0 ? 5 : eventID % 5 < 2 ? 1 : 2;
    EXPECT_EQ(periodsOf(eventID).size(), expected) << eventID;
  }
}

}  // namespace
}  // namespace telvane::testing
