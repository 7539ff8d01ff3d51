#include <gmock/gmock.h>

#include "platform/KeyedArchive.h"
#include "tests/backends/DashboardFixture.h"

namespace telvane::testing {
namespace {

using ::testing::ElementsAre;

constexpr char kPostURL[] = "https://collector.example/logdata";

// A helper that answers at once, or drops what it is given.
class AnsweringHelper final : public ReportingSessionConnectivityInterface {
 public:
  void postURLRequestWithCompletionHandler(URLRequest request, RequestCompletion completion) override {
    requests.push_back(std::move(request));
    if (dropsCompletions) return;
    URLResponse response;
    response.statusCode = 200;
    completion(answer, &response, error);
  }

  std::vector<URLRequest> requests;
  bool dropsCompletions = false;
  Data answer = Data::copyOf("https://collector.example/logs/1");
  std::optional<Error> error;
};

class DashboardLogDataTest : public DashboardFixture {
 protected:
  DashboardLogDataTest() {
    _profile.set(kProfilePostURL, kPostURL);
    make().setReportingSessionConnectivityDelegate(_helper);
  }
  bool upload(const Array& logData) {
    const bool isUploaded = backend().uploadLogData(logData);
    _world.runUntilIdle();
    return isUploaded;
  }
  // What was posted last, as its receiver reads it.
  Value posted() {
    const auto root = keyedarchive::unarchive(_helper->requests.back().body, {.maximumBytes = 256u << 20});
    return root.has_value() ? *root : Value();
  }

  const std::shared_ptr<AnsweringHelper> _helper = std::make_shared<AnsweringHelper>();
};

TEST_F(DashboardLogDataTest, postsTheArchiveAndTellsTheDashboardWhereItLies) {
  _world.clock().setCalendar(Date(Date::TimePoint(std::chrono::seconds(1000))));
  const Array logData{Dictionary{{Key("text"), "hi"}}};
  EXPECT_TRUE(upload(logData));
  ASSERT_EQ(_helper->requests.size(), 1u);
  const URLRequest& request = _helper->requests.front();
  EXPECT_EQ(request.url, kPostURL);
  EXPECT_EQ(request.method, "POST");
  EXPECT_THAT(RecordingConnectivity::headerNames(request), ElementsAre("Content-Type"));
  EXPECT_THAT(request, HasHeader("Content-Type", "application/octet-stream"));
  EXPECT_EQ(posted(), Value(logData));
  EXPECT_TRUE(hasLine(log(), LogLevel::Default,
                      "DashboardBackend(uploadLogData): Log data uploaded to https://collector.example/logs/1"));
  ASSERT_EQ(dashboard().arrivals().size(), 1u);
  const Bytes& datagram = dashboard().arrivals().front().bytes;
  EXPECT_EQ(textOf(datagram), " LogDataUploadLocation=https://collector.example/logs/1");
  EXPECT_THAT(Bytes(datagram.begin() + 16, datagram.begin() + 20), ElementsAre(0, 0, 0, 2)) << "method and code";
  EXPECT_THAT(Bytes(datagram.begin() + 3, datagram.begin() + 8), ElementsAre(0, 0, 0, 3, 0xE8)) << "now";
  EXPECT_EQ(eventIDOf(datagram), 1);
}

TEST_F(DashboardLogDataTest, takesTheNextEventNumber) {
  sendMany(2);
  upload({});
  sendMany(1);
  EXPECT_EQ(eventIDOf(dashboard().arrivals()[2].bytes), 3);
  EXPECT_EQ(eventIDOf(dashboard().arrivals()[3].bytes), 4);
}

TEST_F(DashboardLogDataTest, holdsValuesOfEveryKind) {
  const Array logData{Dictionary{{Key("flag"), true},
                                 {Key("whole"), -7},
                                 {Key("largest"), UINT64_MAX},
                                 {Key("real"), 1.5},
                                 {Key("text"), "ä\n\\="},
                                 {Key("data"), Data::copyOf(std::string_view("\0\xFF", 2))},
                                 {Key("date"), Date(Date::TimePoint(std::chrono::seconds(12)))},
                                 {Key("array"), Array{1, "two", Array()}},
                                 {Key("dictionary"), Dictionary{{Key("a"), Dictionary()}}}},
                      "no dictionary", 3};
  EXPECT_TRUE(upload(logData));
  EXPECT_EQ(posted(), Value(logData));
}

TEST_F(DashboardLogDataTest, mayBeEmpty) {
  EXPECT_TRUE(upload({}));
  EXPECT_EQ(posted(), Value(Array()));
}

TEST_F(DashboardLogDataTest, mayBeLong) {
  Array logData;
  for (int n = 0; n < 10'000; ++n) logData.append(Dictionary{{Key("line"), n}, {Key("text"), std::string(50, 'x')}});
  EXPECT_TRUE(upload(logData));
  EXPECT_EQ(posted(), Value(logData));
}

TEST_F(DashboardLogDataTest, needsAPostURL) {
  _profile.set(kProfilePostURL, Value());
  make().setReportingSessionConnectivityDelegate(_helper);
  log().expectError("DashboardBackend(uploadLogData): Post URL for log data array is nil");
  EXPECT_FALSE(upload({}));
  EXPECT_TRUE(_helper->requests.empty());
}

TEST_F(DashboardLogDataTest, isRefusedWhenItCannotBeWritten) {
  Value deep = 1;
  for (int level = 0; level < 70; ++level) deep = Array{std::move(deep)};
  log().expectError("DashboardBackend(uploadLogData): Failed to serialize log data array for upload");
  EXPECT_FALSE(upload(Array{deep}));
  EXPECT_FALSE(upload(Array{std::string("a\0b", 3)}));
  EXPECT_TRUE(_helper->requests.empty());
}

TEST_F(DashboardLogDataTest, isNoErrorWithoutAConnectivityHelper) {
  make();
  backend().setReportingSessionConnectivityDelegate(std::make_shared<AnsweringHelper>());
  EXPECT_TRUE(upload({}));
  EXPECT_TRUE(dashboard().arrivals().empty());
  EXPECT_TRUE(log().lines().empty());
}

TEST_F(DashboardLogDataTest, tellsOfAnError) {
  _helper->error = Error::withDescription("Test", 5, "the network is down");
  log().expectError("DashboardBackend(uploadLogData): Error uploading log data array (the network is down)");
  EXPECT_FALSE(upload({}));
  EXPECT_TRUE(dashboard().arrivals().empty());
}

TEST_F(DashboardLogDataTest, takesAnEmptyAnswerForAFailure) {
  _helper->answer = {};
  log().expectError("DashboardBackend(uploadLogData): Error uploading log data array ((null))");
  EXPECT_FALSE(upload({}));
}

// A helper that is through calls no completion; the session's queue must not stand still for ever.
TEST_F(DashboardLogDataTest, doesNotWaitForACompletionThatIsDropped) {
  _helper->dropsCompletions = true;
  log().expectError("DashboardBackend(uploadLogData): Error uploading log data array ((null))");
  EXPECT_FALSE(upload({}));
}

TEST_F(DashboardLogDataTest, mendsALocationThatIsNoText) {
  _helper->answer = Data::copyOf("a\xFF\nb=");
  EXPECT_TRUE(upload({}));
  EXPECT_EQ(lastTextAt(dashboard()),
            " LogDataUploadLocation=a\xEF\xBF\xBD"
            "b\\=");
}

// What is longer is a page for people. It is not shown in the log either, where the device's owner would pay for it.
TEST_F(DashboardLogDataTest, takesAnAnswerForALocationThatIsNotLongerThanOne) {
  _helper->answer = Data(std::string(DashboardBackend::kLongestLocation, 'x'));
  EXPECT_TRUE(upload({}));
  EXPECT_TRUE(lastTextAt(dashboard()).starts_with(" LogDataUploadLocation=xxx"));
  const size_t events = dashboard().arrivals().size();
  _helper->answer = Data(std::string(DashboardBackend::kLongestLocation + 1, 'y'));
  log().expectError(
      "DashboardBackend(uploadLogData): Error uploading log data array (an answer of 4097 bytes is no location)");
  EXPECT_FALSE(upload({}));
  EXPECT_EQ(dashboard().arrivals().size(), events);
  EXPECT_TRUE(hasNoLine(log(), "yyy"));
}

TEST_F(DashboardLogDataTest, showsNoControlsOfAnAnswerInTheLog) {
  _helper->answer = Data::copyOf("https://x/\x1b[2J\x7f");
  EXPECT_TRUE(upload({}));
  EXPECT_TRUE(hasLine(log(), "DashboardBackend(uploadLogData): Log data uploaded to https://x/ [2J "));
  EXPECT_TRUE(hasNoLine(log(), "\x1b"));
}

// A helper that answers when the test does, and a session's queue that waits for it.
class WaitingLogDataTest : public DashboardLogDataTest {
 protected:
  WaitingLogDataTest() {
    _profile.set(kProfileReliable, 60'000);  // a tick a minute, so that days pass quickly
    make();
  }
  void startUpload(const Array& logData = Array{1}) {
    _queue->async([this, logData] { _outcome = backend().uploadLogData(logData); });
    _world.runUntilIdle();
  }
  RunningUploads& uploads() { return context().runningUploads(); }
  std::optional<RunningUploads::Place> place(uint64_t bytes) {
    return uploads().begin(RunningUploads::Kind::LogData, _process.platform().dispatch.newSemaphore(0), bytes);
  }
  // Takes all places but one.
  std::vector<RunningUploads::Place> allPlacesButOne() {
    std::vector<RunningUploads::Place> places;
    while (places.size() + 1 < RunningUploads::kMostAtOnce) places.push_back(*place(0));
    return places;
  }

  static constexpr char kNoRoom[] =
      "DashboardBackend(uploadLogData): Too much is being uploaded already, or the daemon is about to end";
  const std::shared_ptr<SerialQueue> _queue = _process.platform().dispatch.newSerialQueue("session");
  std::optional<bool> _outcome;  // nothing while it waits
};

TEST_F(WaitingLogDataTest, waitsForTheAnswerWithoutALimit) {
  startUpload();
  _world.advance(std::chrono::hours(24 * 8));
  EXPECT_EQ(_connectivity->count(), 1u);
  EXPECT_EQ(_outcome, std::nullopt);
  _connectivity->fail(0, Error::withDescription("Test", 5, "late"));
  log().expectError("Error uploading log data array (late)");
  _world.runUntilIdle();
  EXPECT_EQ(_outcome, false);
}

TEST_F(WaitingLogDataTest, waitsNoMoreWhenTheProcessIsToEnd) {
  startUpload();
  log().expectError("DashboardBackend(uploadLogData): Error uploading log data array ((null))");
  uploads().cancelAll();
  _world.runUntilIdle();
  EXPECT_EQ(_outcome, false);
  log().expectError(kNoRoom);
  _outcome.reset();
  startUpload();
  EXPECT_EQ(_outcome, false);
  EXPECT_EQ(_connectivity->count(), 1u) << "nothing more is posted";
  _connectivity->answer(0, 200);
  _world.runUntilIdle();
  EXPECT_TRUE(dashboard().arrivals().empty()) << "too late to be told";
}

TEST_F(WaitingLogDataTest, takesOneOfTheProcesssPlacesForAsLongAsItWaits) {
  const auto others = allPlacesButOne();
  startUpload();
  EXPECT_FALSE(place(0).has_value());
  log().expectError("Error uploading log data array ((null))");
  _connectivity->answer(0, 200);
  _world.runUntilIdle();
  EXPECT_EQ(_outcome, false);
  EXPECT_TRUE(place(0).has_value());
}

TEST_F(WaitingLogDataTest, isRefusedWithoutAPlace) {
  const auto others = allPlacesButOne();
  const auto last = place(0);
  log().expectError(kNoRoom);
  startUpload();
  EXPECT_EQ(_outcome, false);
  EXPECT_TRUE(hasLines(log(), 1, kNoRoom));
  EXPECT_EQ(_connectivity->count(), 0u);
}

TEST_F(WaitingLogDataTest, isRefusedWhereTooManyBytesOfLogDataWaitAlready) {
  const auto other = place(RunningUploads::kMostLogDataBytesAtOnce - 1000);
  ASSERT_TRUE(other.has_value());
  log().expectError(kNoRoom);
  startUpload(Array{std::string(1000, 'x')});
  EXPECT_EQ(_outcome, false);
  EXPECT_EQ(_connectivity->count(), 0u);
  _outcome.reset();
  startUpload();
  EXPECT_EQ(_outcome, std::nullopt) << "a small one has room";
  EXPECT_FALSE(place(1000).has_value()) << "and is counted";
  log().expectError("Error uploading log data array ((null))");
  uploads().cancelAll();
  _world.runUntilIdle();
}

// Nothing is posted then, so it is no upload.
TEST_F(WaitingLogDataTest, needsNoPlaceWithoutAConnectivityHelper) {
  uploads().cancelAll();
  _connectivity.reset();
  EXPECT_TRUE(backend().uploadLogData({}));
}

}  // namespace
}  // namespace telvane::testing
