#include <gmock/gmock.h>

#include "interfaces/TelvaneErrors.h"
#include "tests/connectivity/ConnectivityHelperFixture.h"
#include "tests/support/Matchers.h"

namespace telvane::testing {
namespace {

using Helper = ReportingSessionConnectivityHelper;

class ConnectivityHelperRequestsTest : public ConnectivityHelperFixture {
 protected:
  void expectError(std::string_view text, int64_t code) {
    ASSERT_EQ(completions.size(), 1u);
    ASSERT_TRUE(completions[0].error.has_value());
    EXPECT_EQ(completions[0].error->domain(), kTelvaneErrorDomain.view());
    EXPECT_EQ(completions[0].error->description(), text);
    EXPECT_EQ(completions[0].error->code(), code);
  }
};

TEST_F(ConnectivityHelperRequestsTest, dropsASecondGETOfTheSameURLAndNeverCompletesIt) {
  world.network().answer(kURL, NetworkAnswer::ok("bag").after(std::chrono::seconds(1)));
  givenActiveHelper(Helper::GETRequestMode());
  get();
  get();
  world.advance(std::chrono::seconds(2));
  EXPECT_EQ(completions.size(), 1u);
  EXPECT_EQ(log().count("ignored duplicate request for storebag 'https://collector.example/bag'"), 1u);
  EXPECT_EQ(world.network().requests().size(), 1u);
}

TEST_F(ConnectivityHelperRequestsTest, dropsAGETOfAURLThatWasPulledBefore) {
  world.network().answer(kURL, NetworkAnswer::ok("bag"));
  givenActiveHelper(Helper::GETRequestMode());
  get();
  ASSERT_EQ(completions.size(), 1u);
  get();
  world.advance(std::chrono::hours(24));
  EXPECT_EQ(completions.size(), 1u);
  EXPECT_EQ(world.network().requests().size(), 1u);
}

TEST_F(ConnectivityHelperRequestsTest, startsAnUrgentGETAtOnce) {
  world.network().answer(kURL, NetworkAnswer::ok("bag"));
  givenActiveHelper(Helper::GETRequestMode());
  get();
  ASSERT_EQ(completions.size(), 1u);
  EXPECT_EQ(completions[0].data, "bag");
  EXPECT_EQ(completions[0].status, 200);
  EXPECT_FALSE(completions[0].error.has_value());
  EXPECT_EQ(log().count("storebag immediate pull for 'https://collector.example/bag' has been initiated"), 1u);
}

TEST_F(ConnectivityHelperRequestsTest, startsAnUnhurriedGETWithinTwoHours) {
  world.network().answer(kURL, NetworkAnswer::ok("bag"));
  givenActiveHelper(Helper::GETRequestMode());
  get(false);
  EXPECT_EQ(log().count("storebag delayed pull for 'https://collector.example/bag' delayed by "), 1u);
  world.advance(std::chrono::seconds(7199));
  EXPECT_EQ(completions.size(), 1u);
}

TEST_F(ConnectivityHelperRequestsTest, aGETOnAPOSTHelperCompletesAtOnceWithItsMode) {
  log().expectError("getURLRequestWithCompletionHandler: wrong mode for GET operation detected 4");
  givenActiveHelper(Helper::POSTRequestMode());
  helper->getURLRequestWithCompletionHandler(request(), true, noteCompletion());
  expectError("getURLRequestWithCompletionHandler: unrecognized mode", 4);
}

TEST_F(ConnectivityHelperRequestsTest, aPOSTOnAGETHelperIsLoggedAndNeverCompletes) {
  log().expectError("postURLRequestWithCompletionHandler: wrong mode for POST operation detected 8");
  givenActiveHelper(Helper::GETRequestMode());
  post();
  world.advance(std::chrono::hours(1));
  EXPECT_TRUE(completions.empty());
}

TEST_F(ConnectivityHelperRequestsTest, handsAResponseInPiecesOverAsOne) {
  world.network().answer(
      kURL, NetworkAnswer::ok().withPieces({"one ", "two ", "three"}).withPieceDelay(std::chrono::milliseconds(10)));
  givenActiveHelper(Helper::POSTRequestMode());
  post();
  world.advance(std::chrono::seconds(1));
  ASSERT_EQ(completions.size(), 1u);
  EXPECT_EQ(completions[0].data, "one two three");
}

TEST_F(ConnectivityHelperRequestsTest, aPullAfterInvalidationCompletesWithItsError) {
  givenActiveHelper(Helper::GETRequestMode());
  helper->invalidate();
  world.runUntilIdle();
  get();
  expectError("ConnectivityHelper is not ative", -1);
  EXPECT_EQ(log().count("has been cancelled as NSURLSession is not active"), 1u);
}

TEST_F(ConnectivityHelperRequestsTest, aPullOnAHelperThatWasNeverActiveCompletesWithItsError) {
  givenHelper(Helper::GETRequestMode());
  get();
  expectError("ConnectivityHelper is not ative", -1);
}

TEST_F(ConnectivityHelperRequestsTest, aPOSTOnAnInactiveHelperDoesNothing) {
  givenHelper(Helper::POSTRequestMode());
  post();
  EXPECT_TRUE(completions.empty());
  EXPECT_TRUE(world.network().requests().empty());
}

TEST_F(ConnectivityHelperRequestsTest, passesTransportErrorsOn) {
  world.network().answer(kURL, NetworkAnswer::failure(URLErrorCode::CannotConnectToHost));
  givenActiveHelper(Helper::POSTRequestMode());
  post();
  ASSERT_EQ(completions.size(), 1u);
  EXPECT_EQ(completions[0].status, 0);
  ASSERT_TRUE(completions[0].error.has_value());
  EXPECT_EQ(completions[0].error->code(), static_cast<int64_t>(URLErrorCode::CannotConnectToHost));
}

TEST_F(ConnectivityHelperRequestsTest, namesTasksByOneCounterForAllHelpers) {
  world.network().answer("https://collector.example/", NetworkAnswer::ok());
  givenActiveHelper(Helper::POSTRequestMode());
  post();
  givenActiveHelper(Helper::POSTRequestMode());
  post();
  ASSERT_EQ(world.network().requests().size(), 2u);
  EXPECT_EQ(world.network().requests()[0].taskDescription, "Task_00000001");
  EXPECT_EQ(world.network().requests()[1].taskDescription, "Task_00000002");
  EXPECT_EQ(log().count("ConnectivityHelperTask with ID <Task_00000001> dealloced"), 1u);
}

TEST_F(ConnectivityHelperRequestsTest, aBackgroundPOSTGoesOutFromAContainerThatIsGoneAfterwards) {
  world.network().answer(kURL, NetworkAnswer::ok());
  ASSERT_TRUE(process.platform().files.createDirectory(Helper::storageRootFolder()).has_value());
  givenActiveHelper(Helper::kBackgroundPOSTRequestMode);
  URLRequest made = request();
  made.method = "POST";
  made.body = Data::copyOf("events");
  helper->postURLRequestWithCompletionHandler(std::move(made), noteCompletion());
  world.runUntilIdle();
  ASSERT_EQ(world.network().requests().size(), 1u);
  EXPECT_TRUE(world.network().requests().front().isUpload);
  EXPECT_EQ(world.network().requests().front().request.body.view(), "events");
  EXPECT_TRUE(process.platform().files.filesBelow(Helper::storageRootFolder())->empty());
}

// There is no folder for containers, so none can have been made.
TEST_F(ConnectivityHelperRequestsTest, aBodyThatIsAFileGoesOutFromItInEitherMode) {
  world.network().answer(kURL, NetworkAnswer::ok());
  for (const int32_t mode : {Helper::POSTRequestMode(), Helper::kBackgroundPOSTRequestMode}) {
    givenActiveHelper(mode);
    const auto file = std::shared_ptr(process.platform().files.newTemporaryFile("/tmp").value());
    ASSERT_TRUE(isOk(file->append("a large body")));
    URLRequest made = request();
    made.method = "POST";
    made.bodyFile = file;
    helper->postURLRequestWithCompletionHandler(std::move(made), noteCompletion());
    world.runUntilIdle();
    ASSERT_FALSE(world.network().requests().empty()) << mode;
    EXPECT_TRUE(world.network().requests().back().isUpload);
    EXPECT_EQ(world.network().requests().back().request.body.view(), "a large body");
  }
  EXPECT_EQ(world.network().requests().size(), 2u);
  EXPECT_EQ(completions.size(), 2u);
}

TEST_F(ConnectivityHelperRequestsTest, aBackgroundPOSTWithoutAPlaceForItsContainerStopsSilently) {
  givenActiveHelper(Helper::kBackgroundPOSTRequestMode);
  const size_t before = log().lines().size();
  post();
  EXPECT_TRUE(world.network().requests().empty());
  EXPECT_TRUE(completions.empty());
  EXPECT_EQ(log().lines().size(), before) << log().text();
}

TEST_F(ConnectivityHelperRequestsTest, tellsTheStoryOfATaskInTheLog) {
  world.network().answer(kURL, NetworkAnswer::ok("12345"));
  givenActiveHelper(Helper::GETRequestMode());
  get();
  const std::string id = world.network().requests().front().sessionDescription;
  const std::string both = "<session>:<task> <" + id + ">:<Task_00000001>";
  EXPECT_EQ(log().count("createHelperForTask: created helperTask for task <Task_00000001>"), 1u);
  EXPECT_EQ(log().count("ConnectivityHelperTask with ID <Task_00000001> created"), 1u);
  EXPECT_EQ(log().count("didReceiveResponse: for " + both), 1u);
  EXPECT_EQ(log().count("didReceiveData: received 5 bytes for " + both), 1u);
  EXPECT_EQ(log().count("didCompleteWithError: for " + both + " with response 200, error (null)"), 1u);
  EXPECT_EQ(log().count(std::string("new storebag pull for '") + kURL + "' has been completed with error (null)"), 1u);
  EXPECT_EQ(log().count("ConnectivityHelperTask with ID <Task_00000001> dealloced"), 1u);
}

}  // namespace
}  // namespace telvane::testing
