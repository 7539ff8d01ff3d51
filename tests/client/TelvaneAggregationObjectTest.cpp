#include "client/TelvaneAggregationObject.h"

#include <gtest/gtest.h>

#include <stdexcept>
#include <tuple>
#include <vector>

#include "tests/support/RecordingLog.h"

namespace telvane::testing {
namespace {

using Message = std::tuple<Value, double, uint16_t, uint16_t, Value>;

constexpr uint16_t kSendMessageToClient = 1;

class TelvaneAggregationObjectTest : public ::testing::Test {
 protected:
  TelvaneAggregationObject::AggregationBlock recorder() {
    return [this](const Value& client, double timestamp, uint16_t category, uint16_t type, const Value& payload) {
      _received.emplace_back(client, timestamp, category, type, payload);
    };
  }
  void call(TelvaneAggregationObject& object, uint16_t operation, Array arguments) {
    object.invoke({operation, std::move(arguments), {}}, {});
  }

  RecordingLog _log;
  std::vector<Message> _received;
};

TEST_F(TelvaneAggregationObjectTest, passesAllFiveArgumentsToTheBlock) {
  TelvaneAggregationObject object(recorder(), _log);
  const Dictionary client{{Key("ComponentType"), 7}};
  const Dictionary payload{{Key("a"), 1}};
  call(object, kSendMessageToClient, {client, 12.5, 40000, 3, payload});
  ASSERT_EQ(_received.size(), 1u);
  EXPECT_EQ(_received[0], Message(client, 12.5, 40000, 3, payload));
  EXPECT_EQ(_log.count("sendMessageToClient: 40000, 3"), 1u) << _log.text();
}

TEST_F(TelvaneAggregationObjectTest, passesTheEndOfASessionOn) {
  TelvaneAggregationObject object(recorder(), _log);
  call(object, kSendMessageToClient, {{}, 0.0, 0, 0, {}});
  ASSERT_EQ(_received.size(), 1u);
  EXPECT_EQ(_received[0], Message({}, 0.0, 0, 0, {}));
}

TEST_F(TelvaneAggregationObjectTest, onlyLogsWithoutABlock) {
  TelvaneAggregationObject object({}, _log);
  call(object, kSendMessageToClient, {{}, 0.0, 1, 2, {}});
  EXPECT_EQ(_log.count("sendMessageToClient: 1, 2"), 1u) << _log.text();
}

TEST_F(TelvaneAggregationObjectTest, letsABlockGoThatThrows) {
  int calls = 0;
  auto held = std::make_shared<int>(0);
  const std::weak_ptr<int> weak = held;
  TelvaneAggregationObject object(
      [&calls, held = std::move(held)](const Value&, double, uint16_t, uint16_t, const Value&) {
        ++calls;
        throw std::runtime_error("no");
      },
      _log);
  _log.expectError("sendMessageToClient: Exception during invocation of aggregation block. Disabling aggregation");
  call(object, kSendMessageToClient, {{}, 1.0, 1, 2, {}});
  call(object, kSendMessageToClient, {{}, 1.0, 3, 4, {}});
  EXPECT_EQ(calls, 1);
  EXPECT_TRUE(weak.expired()) << "the block must be released";
  EXPECT_EQ(_log.count("sendMessageToClient: 3, 4"), 1u) << _log.text();
  EXPECT_EQ(_log.count(LogLevel::Error, "Disabling aggregation"), 1u) << _log.text();
}

TEST_F(TelvaneAggregationObjectTest, survivesABlockThatThrowsWhatIsNoException) {
  TelvaneAggregationObject object([](const Value&, double, uint16_t, uint16_t, const Value&) { throw 1; }, _log);
  _log.expectError("Disabling aggregation");
  call(object, kSendMessageToClient, {{}, 1.0, 1, 2, {}});
}

TEST_F(TelvaneAggregationObjectTest, refusesWhatIsNoWholeCall) {
  TelvaneAggregationObject object(recorder(), _log);
  _log.expectError("arguments that it does not take");
  call(object, 2, {{}, 0.0, 1, 2, {}});
  call(object, kSendMessageToClient, {});
  call(object, kSendMessageToClient, {Value("client"), 0.0, 1, 2, {}});
  call(object, kSendMessageToClient, {{}, "0", 1, 2, {}});
  call(object, kSendMessageToClient, {{}, 0.0, Array{1}, 2, {}});
  call(object, kSendMessageToClient, {{}, 0.0, 1, Value(), {}});
  call(object, kSendMessageToClient, {{}, 0.0, 1, 2, Array{1}});
  call(object, kSendMessageToClient, {{}, 0.0, 1, 2, {}, 6});
  EXPECT_TRUE(_received.empty());
  EXPECT_EQ(_log.count(LogLevel::Error, "arguments that it does not take"), 8u) << _log.text();
}

}  // namespace
}  // namespace telvane::testing
