#include "tests/soak/SoakLedger.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace telvane::testing {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using Answer = SoakLedger::Answer;
using Missing = SoakLedger::Missing;
using Reason = SoakLedger::Reason;
using Road = SoakLedger::Road;

class SoakLedgerTest : public ::testing::Test {
 protected:
  SoakLedger ledger;
};

TEST_F(SoakLedgerTest, namesAnEventThatIsMissingWithoutAReason) {
  const auto session = ledger.openSession("a");
  ledger.arrive(ledger.sendEvent(session), Answer::Taken);
  ledger.sendEvent(session);
  EXPECT_THAT(ledger.faults(Missing::MayStillCome), IsEmpty());
  EXPECT_THAT(ledger.faults(Missing::IsFault), ElementsAre(HasSubstr("event 1 of session 0")));
  EXPECT_THAT(ledger.summary(), HasSubstr("1 unaccounted for"));
  EXPECT_EQ(ledger.taken(), 1u);
}

TEST_F(SoakLedgerTest, namesAnEventThatCameTwiceAndOneThatNobodySent) {
  const auto number = ledger.sendEvent(ledger.openSession("a"));
  ledger.arrive(number, Answer::Taken);
  ledger.arrive(number, Answer::Taken);
  ledger.arrive(17, Answer::Taken);
  EXPECT_THAT(ledger.faults(Missing::IsFault),
              ElementsAre("nobody sent the event 17", HasSubstr("event 0 of session 0 of family a came 2 times")));
}

TEST_F(SoakLedgerTest, letsAnEventComeAgainOnlyWhereAConnectionBroke) {
  SoakLedger patient(SoakLedger::Repeats::MayFollowBrokenConnections);
  const auto session = patient.openSession("a");
  const auto broken = patient.sendEvent(session);
  patient.arrive(broken, Answer::ConnectionBroken);
  patient.arrive(broken, Answer::Taken);
  EXPECT_THAT(patient.faults(Missing::IsFault), IsEmpty());
  patient.arrive(broken, Answer::Taken);
  EXPECT_THAT(patient.faults(Missing::IsFault),
              ElementsAre(HasSubstr("event 0 of session 0 of family a came 3 times")));
  const auto strict = ledger.sendEvent(ledger.openSession("a"));
  ledger.arrive(strict, Answer::ConnectionBroken);
  ledger.arrive(strict, Answer::Taken);
  EXPECT_THAT(ledger.faults(Missing::IsFault), ElementsAre(HasSubstr("came 2 times")));
}

TEST_F(SoakLedgerTest, namesAFilteredEventThatCame) {
  const auto session = ledger.openSession("a");
  ledger.sendEvent(session, Road::Filtered);
  EXPECT_THAT(ledger.faults(Missing::IsFault), IsEmpty());
  ledger.arrive(ledger.sendEvent(session, Road::Filtered), Answer::Taken);
  EXPECT_THAT(ledger.faults(Missing::IsFault), ElementsAre(HasSubstr("event 1")));
}

TEST_F(SoakLedgerTest, accountsWhatIsMissingToTheFirstReasonOfItsSession) {
  const auto killed = ledger.openSession("a");
  const auto other = ledger.openSession("b");
  ledger.sendEvent(killed);
  ledger.excuse(killed, Reason::Killed);
  ledger.excuse(killed, Reason::OneTooMany);
  ledger.sendEvent(other);
  EXPECT_THAT(ledger.faults(Missing::IsFault), ElementsAre(HasSubstr("session 1")));
  EXPECT_THAT(ledger.summary(), HasSubstr("1 lost with a killed client"));
}

TEST_F(SoakLedgerTest, accountsNothingToTheCollectorsAbsenceWhereThereIsAnotherReason) {
  const auto killed = ledger.openSession("a");
  const auto disabled = ledger.openSession("b");
  const auto unlucky = ledger.openSession("c");
  const auto late = ledger.openSession("d");
  for (const auto session : {killed, disabled, unlucky}) {
    ledger.sendEvent(session);
    ledger.excuse(session, Reason::CollectorAway);
  }
  ledger.sendEvent(late);
  ledger.excuse(killed, Reason::Killed);
  ledger.excuse(killed, Reason::CollectorAway);
  ledger.arrive(ledger.sendEvent(disabled), Answer::ServerError);
  EXPECT_THAT(ledger.accounts(),
              ::testing::UnorderedElementsAre(::testing::Pair("lost with a killed client", 1u),
                                              ::testing::Pair("dropped, backend disabled by the server", 1u),
                                              ::testing::Pair("refused by the server", 1u),
                                              ::testing::Pair("lost while the collector was away", 1u),
                                              ::testing::Pair("unaccounted for", 1u)));
  EXPECT_THAT(ledger.faults(Missing::IsFault), ElementsAre(HasSubstr("session 3")));
}

TEST_F(SoakLedgerTest, accountsWhatAWholeFamilyMissesToTheServersError) {
  const auto parent = ledger.openSession("a");
  const auto child = ledger.openSession("a");
  const auto stranger = ledger.openSession("b");
  const auto refused = ledger.sendEvent(parent);
  ledger.sendEvent(child);
  ledger.sendEvent(stranger);
  ledger.arrive(refused, Answer::ServerError);
  EXPECT_THAT(ledger.faults(Missing::IsFault), ElementsAre(HasSubstr("session 2")));
  EXPECT_THAT(ledger.summary(), HasSubstr("1 refused by the server"));
  EXPECT_THAT(ledger.summary(), HasSubstr("1 dropped, backend disabled by the server"));
}

}  // namespace
}  // namespace telvane::testing
