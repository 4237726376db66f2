// When the reply to a start comes, and when it never does; replies that come twice or not at all.

#include "tests/support/QVEndToEndTest.h"

#include <gmock/gmock.h>

namespace {

using ::testing::ElementsAre;

constexpr uint16_t kTelephony = 2;
constexpr uint16_t kUnknown = 65535;

class QVStartReplyTest : public QVEndToEndTest {};

TEST_F(QVStartReplyTest, ComesWhenTheSessionStops) {
  auto client = connectClient();
  client.create(7, kTelephony);
  const uint32_t start = client.start(7);
  EXPECT_FALSE(client.takeReply(start).has_value());

  const uint32_t stop = client.post(stopCall(7));
  // Before the stop's own reply.
  const auto first = client.receive();
  ASSERT_TRUE(first.has_value());
  EXPECT_EQ(first->replySerial, start);
  EXPECT_TRUE(first->boolean());
  EXPECT_TRUE(client.awaitReply(stop).boolean());
}

TEST_F(QVStartReplyTest, ComesAtOnceForAStartedSession) {
  auto client = connectClient();
  client.create(7, kTelephony);
  const uint32_t first = client.start(7);
  EXPECT_TRUE(client.call(startCall(7)).boolean());
  EXPECT_FALSE(client.takeReply(first).has_value());
}

TEST_F(QVStartReplyTest, ComesAtOnceWhereThereIsNoSuchSession) {
  auto client = connectClient();
  client.create(0);
  EXPECT_TRUE(client.call(startCall(0)).boolean());
  EXPECT_TRUE(client.call(startCall(7)).boolean());
}

TEST_F(QVStartReplyTest, GoesToTheClientThatStartedAnothersSession) {
  auto owner = connectClient();
  auto other = connectClient();
  owner.create(7, kTelephony);
  const uint32_t start = other.start(7);
  owner.stop(7);
  EXPECT_TRUE(other.awaitReply(start).boolean());
}

TEST_F(QVStartReplyTest, ComesForEachStartWhoeverStartedTheSession) {
  auto owner = connectClient();
  auto other = connectClient();
  owner.create(7, kTelephony);
  const uint32_t first = other.start(7);
  owner.stop(7);
  EXPECT_TRUE(other.awaitReply(first).boolean());
  const uint32_t second = owner.start(7);
  EXPECT_FALSE(owner.takeReply(second).has_value());
  owner.stop(7);
  EXPECT_TRUE(owner.awaitReply(second).boolean());
}

TEST_F(QVStartReplyTest, NeverComesForADestroyedSession) {
  auto client = connectClient();
  client.create(7, kTelephony);
  const uint32_t start = client.start(7);
  client.destroy(7);
  expectLogged("deallocing this session 7");
  client.awaitOperations();
  EXPECT_FALSE(client.takeReply(start).has_value());
}

TEST_F(QVStartReplyTest, NeverComesForAReplacedSession) {
  auto client = connectClient();
  client.create(7, kTelephony);
  const uint32_t start = client.start(7);
  client.create(7, kTelephony);
  expectLogged("deallocing this session 7");
  client.stop(7);
  EXPECT_FALSE(client.takeReply(start).has_value());
}

TEST_F(QVStartReplyTest, NeverComesForASessionThatItsOwnerLeftBehind) {
  auto owner = connectClient();
  auto other = connectClient();
  owner.create(7, kTelephony);
  const uint32_t start = other.start(7);
  owner.close();
  expectLogged("deallocing this session 7");
  other.awaitOperations();
  EXPECT_FALSE(other.takeReply(start).has_value());
}

TEST_F(QVStartReplyTest, ComesToNobodyOnceTheStarterIsGone) {
  auto owner = connectClient();
  owner.create(7, kTelephony);
  {
    auto other = connectClient();
    other.start(7);
  }
  expectLogged("dealloc " + std::to_string(::getpid()) + " from the server client list");
  owner.stop(7);
  expectServes(owner);
}

TEST_F(QVStartReplyTest, ServiceTypeOfReporterZeroIsAnsweredTwice) {
  auto client = connectClient();
  const uint32_t serial = client.post(getServiceTypeCall(0));
  client.awaitOperations();
  for (int i = 0; i < 2; ++i) {
    const auto reply = client.takeReply(serial);
    ASSERT_TRUE(reply.has_value());
    EXPECT_EQ(reply->unsigned16(), kUnknown);
  }
  EXPECT_FALSE(client.takeReply(serial).has_value());
}

TEST_F(QVStartReplyTest, CallsThatExpectNoReplyGetNone) {
  auto client = connectClient();
  std::vector<uint32_t> serials;
  for (QVPeerCall call :
       {createCall(7), setServiceTypeCall(kTelephony, 7), configureCall({}, 7),
        getServiceTypeCall(7), getServiceTypeCall(0), startCall(7),
        sendCall({{"a", 1}}, {7}, kSessionPlayback, kStart), validateCall(7), listCall(),
        stopCall(7), pingCall(), QVPeerCall{.member = "NoSuchMember"}}) {
    call.flags = kBusNoReplyExpected;
    serials.push_back(client.post(call));
  }
  // All of them were carried out.
  EXPECT_EQ(client.serviceType(7), kTelephony);
  for (const uint32_t serial : serials) EXPECT_FALSE(client.takeReply(serial).has_value());
  endService();
  EXPECT_THAT(store().rows("SELECT payload FROM beacon_message WHERE category <> 65535"),
              ElementsAre("{\"a\":1}"));
}

TEST_F(QVStartReplyTest, RepliesKeepTheOrderOfTheirCalls) {
  constexpr uint32_t kCalls = 1000;
  auto client = connectClient();
  std::string batch;
  for (uint32_t serial = 1; serial <= kCalls; ++serial) {
    batch += (serial % 2 == 0 ? createCall(serial) : validateCall(serial)).bytes(serial);
  }
  ASSERT_TRUE(client.send(batch));
  for (uint32_t serial = 1; serial <= kCalls; ++serial) {
    const auto reply = client.receive();
    ASSERT_TRUE(reply.has_value());
    ASSERT_EQ(reply->replySerial, serial);
  }
}

}  // namespace
