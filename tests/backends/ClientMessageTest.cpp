#include "backends/ClientMessage.h"

#include <gtest/gtest.h>

#include "interfaces/SessionKeys.h"

namespace telvane::testing {
namespace {

const Dictionary kOwn{{Key("own"), 1}};
const Dictionary kShared{{Key("shared"), 2}};

TEST(ClientMessageTest, isTheClientsDataOfWhatASessionHasWrapped) {
  EXPECT_EQ(sentByClient({{kTelvaneMessageBlobClientData, kOwn}}), kOwn);
  EXPECT_EQ(sentByClient({{kTelvaneMessageBlobClientData, kOwn}, {kTelvaneMessageBlobSharedData, kShared}}), kOwn);
}

TEST(ClientMessageTest, isEmptyWhereTheClientSentNothing) {
  EXPECT_EQ(sentByClient({}), Dictionary());
  EXPECT_EQ(sentByClient({{kTelvaneMessageBlobSharedData, kShared}}), Dictionary());
}

// Whatever its keys are called: only a session's own wrapping is taken off.
TEST(ClientMessageTest, isAMessageOfAnyOtherShapeAsItIs) {
  const Dictionary messages[] = {{{Key("bare"), true}},
                                 {{kTelvaneMessageBlobClientData, "text"}},
                                 {{kTelvaneMessageBlobSharedData, 5}},
                                 {{kTelvaneMessageBlobClientData, kOwn}, {Key("more"), 2}},
                                 {{kTelvaneMessageBlobClientData, kOwn}, {kTelvaneMessageBlobSharedData, 5}}};
  for (const Dictionary& message : messages) EXPECT_EQ(sentByClient(message), message);
}

}  // namespace
}  // namespace telvane::testing
