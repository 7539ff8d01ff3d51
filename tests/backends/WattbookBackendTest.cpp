#include "backends/WattbookBackend.h"

#include "interfaces/SessionKeys.h"
#include "tests/backends/BackendFixture.h"

namespace telvane::testing {
namespace {

class WattbookBackendTest : public BackendFixture {
 protected:
  std::shared_ptr<WattbookBackend> newWattbookBackend(const Value& profile = Dictionary()) {
    return WattbookBackend::initWithName(context(), "power", profile, _productFamily);
  }
  // The form that writes.
  std::optional<String> write(WattbookBackend& backend, Dictionary message, uint16_t method, uint16_t respCode,
                              uint16_t eventID) {
    return backend.sendMessage(std::move(message), _world.clock().now(), method, respCode, eventID);
  }
  std::vector<RecordingPowerLog::Entry> entries() { return process().powerLog().entries(); }
};

TEST_F(WattbookBackendTest, writesTheMessageWithItsNumbersIntoThePowerLog) {
  const auto backend = newWattbookBackend();
  const Dictionary message{{Key("rating"), 5}, {Key("method"), "the client's own"}};
  EXPECT_EQ(write(*backend, message, 65535, 2, 65534), std::nullopt);
  ASSERT_EQ(entries().size(), 1u);
  EXPECT_EQ(entries()[0].eventClass, 28u);
  EXPECT_EQ(entries()[0].eventName, "MediahostD-TVN");
  EXPECT_EQ(entries()[0].payload,
            (Dictionary{{Key("rating"), 5}, {Key("method"), 65535}, {Key("respCode"), 2}, {Key("event"), 65534}}));
  EXPECT_EQ(message[Key("method")].text(), "the client's own") << "the sender's message stays as it is";
}

TEST_F(WattbookBackendTest, ignoresTheMethodZeroAndAnEmptyMessage) {
  const auto backend = newWattbookBackend();
  write(*backend, {{Key("n"), 1}}, 0, 2, 1);
  write(*backend, {}, 7, 2, 1);
  EXPECT_TRUE(entries().empty());
  write(*backend, {{Key("n"), 1}}, 1, 0, 0);
  EXPECT_EQ(entries().size(), 1u);
}

TEST_F(WattbookBackendTest, whatASessionSendsDoesNotReachThePowerLog) {
  const auto backend = TelvaneBackend::newBackendWithName(context(), "power", Dictionary(), _productFamily, 7);
  ASSERT_NE(backend, nullptr);
  EXPECT_EQ(backend->updateState(), TelvaneBackendStateEnabled);
  const Dictionary blob{{kTelvaneMessageBlobClientData, Dictionary{{Key("n"), 1}}}};
  const uint32_t flag = 3;
  EXPECT_EQ(backend->sendMessage(blob, _world.clock().now(), 7, 2, flag), std::nullopt);
  EXPECT_EQ(backend->sendMessage(blob, _world.clock().now(), 7, 2, 1, flag), std::nullopt);
  EXPECT_TRUE(entries().empty());
}

TEST_F(WattbookBackendTest, readsNothingInItsSection) {
  for (const Value& profile : {Value(), Value(5), Value(Array())}) {
    const auto backend = TelvaneBackend::newBackendWithName(context(), "power", profile, std::nullopt, 5);
    ASSERT_NE(backend, nullptr);
    EXPECT_EQ(backend->name(), "power");
    EXPECT_EQ(backend->displayURL(), std::nullopt);
    EXPECT_FALSE(backend->isHTTPSPostBackend());
  }
}

}  // namespace
}  // namespace telvane::testing
