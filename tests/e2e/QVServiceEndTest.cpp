// How the service ends, and what is stored then.

#include "tests/support/QVEndToEndTest.h"

#include <csignal>
#include <filesystem>

#include <gmock/gmock.h>

namespace {

using ::testing::ElementsAre;

constexpr uint16_t kTelephony = 2;
constexpr uint16_t kAPIUsage = 12;

class QVServiceEndTest : public QVEndToEndTest {};

class QVOrderlyEndTest : public QVServiceEndTest, public ::testing::WithParamInterface<int> {};

TEST_P(QVOrderlyEndTest, StoresEverythingThatWasSent) {
  constexpr int kMessages = 2000;
  auto first = connectClient();
  auto second = connectClient();
  first.create(1, kTelephony);
  second.create(2, kTelephony);
  const uint32_t start = first.start(1);
  second.start(2);
  std::string batch;
  for (int i = 1; i <= kMessages; ++i) {
    auto call = sendCall({{"i", i}}, {1, 2}, kSessionPlayback, kStart);
    call.flags = kBusNoReplyExpected;
    batch += call.bytes(1000);
  }
  first.awaitOperations();
  second.awaitOperations();
  // Some of it the service has not read yet when it is told to end.
  ASSERT_TRUE(first.send(batch));
  service().signal(GetParam());
  EXPECT_EQ(service().wait(), 0) << service().log();

  // Both connections were closed; the start was not answered.
  while (const auto message = first.receive()) EXPECT_NE(message->replySerial, start);
  second.awaitClose();
  EXPECT_FALSE(std::filesystem::exists(root_.socket()));
  EXPECT_THAT(store().rows("SELECT session_id, count(*), sum(category = 65535) FROM beacon_message "
                           "GROUP BY session_id ORDER BY session_id"),
              ElementsAre("1|2001|1", "2|2001|1"));
  EXPECT_EQ(store().number("SELECT count(*) FROM countwise_event WHERE name LIKE '%Playback%'"),
            2 * kMessages);
  EXPECT_EQ(store().number("SELECT count(*) FROM countwise_event WHERE name LIKE '%uptime'"), 2);
  EXPECT_EQ(store().number("SELECT count(*) FROM beacon_session WHERE flushed_at IS NOT NULL"), 2);
  EXPECT_EQ(store().count("loss"), 0);
  EXPECT_EQ(log().count("deallocing this session"), 2U);
  EXPECT_EQ(log().count("dealloc "), 2U);
}

INSTANTIATE_TEST_SUITE_P(Signals, QVOrderlyEndTest, ::testing::Values(SIGTERM, SIGINT),
                         [](const auto& given) {
                           return given.param == SIGTERM ? "SIGTERM" : "SIGINT";
                         });

TEST_F(QVServiceEndTest, IdleServiceEndsInGoodOrder) {
  service();
  endService();
  EXPECT_FALSE(std::filesystem::exists(root_.socket()));
}

TEST_F(QVServiceEndTest, ASecondSignalChangesNothing) {
  auto client = connectClient();
  client.create(1, kTelephony);
  client.start(1);
  client.sendMessage({{"a", 1}}, {1});
  service().signal(SIGTERM);
  service().signal(SIGINT);
  service().signal(SIGTERM);
  EXPECT_EQ(service().wait(), 0);
  EXPECT_EQ(store().count("beacon_message"), 2);
}

TEST_F(QVServiceEndTest, APeerThatSendsWithoutEndDoesNotKeepItAlive) {
  auto client = connectClient();
  client.create(1, kTelephony);
  client.start(1);
  // The replies stay unread, so at last the service reads no more and the socket is full.
  auto call = sendCall({{"text", std::string(1000, 'x')}}, {1}, kSessionPlayback, kStart);
  const std::string bytes = call.bytes(1000);
  std::size_t sent = bytes.size();
  for (int i = 0; i < 100'000 && sent == bytes.size(); ++i) {
    sent = client.sendWithoutWaiting(bytes);
  }
  service().signal(SIGTERM);
  EXPECT_EQ(service().wait(), 0);
  EXPECT_EQ(store().number("SELECT count(*) FROM beacon_session WHERE flushed_at IS NOT NULL"), 1);
  EXPECT_EQ(store().number("SELECT count(*) FROM beacon_message WHERE category = 65535"), 1);
  EXPECT_EQ(store().count("loss"), 0);
}

TEST_F(QVServiceEndTest, KillServiceEndsAtOnceWithoutAReply) {
  auto client = connectClient();
  auto other = connectClient();
  other.create(1, kTelephony);
  other.start(1);
  other.sendMessage({{"a", 1}}, {1});
  client.post(killCall());
  EXPECT_EQ(service().wait(), 2);
  EXPECT_FALSE(client.receive().has_value());
  other.awaitClose();
  EXPECT_EQ(log().count("DESTROYING SERVICE"), 1U);
  // No session was stopped.
  EXPECT_EQ(log().count("sending summary event"), 0U);
  EXPECT_EQ(log().count("InvalidationHandler"), 0U);
}

TEST_F(QVServiceEndTest, KillServiceIsNotFollowedByAnythingSentBehindIt) {
  auto client = connectClient();
  ASSERT_TRUE(client.send(createCall(1).bytes(1) + killCall().bytes(2) + createCall(2).bytes(3)));
  EXPECT_EQ(service().wait(), 2);
  EXPECT_EQ(log().count("created reporting session for ID: 2"), 0U);
}

TEST_F(QVServiceEndTest, TheNextServiceTakesUpTheStore) {
  for (const int round : {1, 2, 3}) {
    auto client = connectClient();
    client.create(round, kTelephony);
    client.start(round);
    client.sendMessage({{"round", round}}, {round});
    endService();
    forgetService();
  }
  EXPECT_THAT(store().rows("SELECT session_id FROM beacon_session ORDER BY id"),
              ElementsAre("1", "2", "3"));
  EXPECT_EQ(store().count("beacon_message"), 6);
}

TEST_F(QVServiceEndTest, CommittedRowsSurviveAKill) {
  {
    auto client = connectClient();
    client.create(1, kAPIUsage);
    client.start(1);
    client.sendMessage({{"a", 1}}, {1});
    expectStored("SELECT * FROM beacon_message", 1);
    service().signal(SIGKILL);
    EXPECT_EQ(service().wait(), -SIGKILL);
  }
  forgetService();
  // The next service finds them, and goes on.
  auto client = connectClient();
  client.create(2, kAPIUsage);
  client.start(2);
  client.sendMessage({{"a", 2}}, {2});
  endService();
  EXPECT_THAT(store().rows("PRAGMA integrity_check"), ElementsAre("ok"));
  EXPECT_THAT(store().rows("SELECT session_id, payload FROM beacon_message "
                           "WHERE category <> 65535 ORDER BY id"),
              ElementsAre("1|{\"a\":1}", "2|{\"a\":2}"));
  EXPECT_EQ(log().count("<3>"), 0U) << ::testing::PrintToString(log().lines("<3>"));
}

TEST_F(QVServiceEndTest, ABrokenPipeIsSurvived) {
  service().signal(SIGPIPE);
  auto client = connectClient();
  expectServes(client);
  endService();
}

}  // namespace
