// Peers that keep to the protocol and are a burden all the same: that do not read, vanish in the
// middle, or use up what there is.

#include "tests/support/QVEndToEndTest.h"

#include <deque>
#include <filesystem>
#include <fstream>

#include <gmock/gmock.h>
#include <sys/resource.h>

namespace {

using ::testing::ElementsAre;

class QVPeerPressureTest : public QVEndToEndTest {
 protected:
  // From now on clients get no descriptors of the service's but those it has: an eighth of those
  // that it may have it keeps for itself.
  void useUpDescriptors() {
    const std::string folder = "/proc/" + std::to_string(service().pid()) + "/fd/";
    rlim_t lowestFree = 0;
    while (std::filesystem::is_symlink(folder + std::to_string(lowestFree))) ++lowestFree;
    rlimit limits{};
    ASSERT_EQ(::prlimit(service().pid(), RLIMIT_NOFILE, nullptr, &limits), 0);
    limits.rlim_cur = lowestFree + lowestFree / 7;
    ASSERT_EQ(::prlimit(service().pid(), RLIMIT_NOFILE, &limits, nullptr), 0);
  }

  QVPeerClient witness_{connectClient()};
};

TEST_F(QVPeerPressureTest, APeerThatReadsNoRepliesIsNotReadEither) {
  // Of introspection, whose replies are large: far more than the service may hold for one peer and
  // the sockets' buffers together.
  constexpr std::size_t kMostCalls = 20'000;
  QVPeerCall introspect{.member = "Introspect", .interface = "org.freedesktop.DBus.Introspectable"};
  QVRawPeer peer(root_.socket());
  std::string unsent;
  uint32_t calls = 0;
  const long before = service().statusNumber("status", "VmRSS");
  while (unsent.empty() && calls < kMostCalls) {
    unsent = introspect.bytes(++calls);
    unsent.erase(0, peer.sendWithoutWaiting(unsent));
    // Whatever the service could take in by now, it has: its socket was full before.
    if (!unsent.empty()) {
      expectServes(witness_);
      unsent.erase(0, peer.sendWithoutWaiting(unsent));
    }
  }
  ASSERT_FALSE(unsent.empty()) << "the service never stopped reading";
  expectServes(witness_);
  if (kMemoryTells) {
    // Kilobytes: the bound of 1 MiB, twice while it is handed over, and room for everything else.
    EXPECT_LT(service().statusNumber("status", "VmRSS") - before, 6 * 1024);
  }

  // Once the peer reads, it gets every reply.
  for (uint32_t serial = 1; serial < calls; ++serial) {
    const auto reply = peer.receive();
    ASSERT_TRUE(reply.has_value());
    ASSERT_EQ(reply->replySerial, serial);
  }
  ASSERT_TRUE(peer.send(unsent));
  EXPECT_TRUE(peer.awaitReply(calls).isReturn());
}

TEST_F(QVPeerPressureTest, AClientIsHeardHoweverMuchItsSessionsKeep) {
  // Together more than the service takes in before it has got rid of some.
  constexpr int64_t kSessions = 1'200;
  const QVDictionary configuration{{"text", std::string(60'000, 'x')}};
  for (int64_t reporterID = 1; reporterID <= kSessions; ++reporterID) {
    witness_.create(reporterID);
    witness_.configure(configuration, reporterID);
  }
  witness_.destroy(1);
  EXPECT_FALSE(witness_.isValid(1));
  EXPECT_TRUE(witness_.isValid(kSessions));
}

TEST_F(QVPeerPressureTest, APeerThatVanishesWithUnreadRepliesIsHeardToTheEnd) {
  witness_.create(7);
  witness_.start(7);
  {
    QVRawPeer peer(root_.socket());
    std::string batch;
    for (int i = 1; i <= 100; ++i) {
      batch += sendCall({{"i", i}}, {7}, kSessionPlayback, kStart).bytes(static_cast<uint32_t>(i));
    }
    ASSERT_TRUE(peer.send(batch));
  }
  expectLogged("InvalidationHandler: connection exited");
  witness_.awaitOperations();
  endService();
  EXPECT_EQ(store().number("SELECT count(*) FROM beacon_message WHERE category <> 65535"), 100);
}

TEST_F(QVPeerPressureTest, AMessageByHalfIsLostWithItsPeer) {
  witness_.create(7);
  witness_.start(7);
  const std::string whole = sendCall({{"whole", 1}}, {7}, kSessionPlayback, kStart).bytes(1);
  const std::string half = sendCall({{"half", 1}}, {7}, kSessionPlayback, kStart).bytes(2);
  {
    QVRawPeer peer(root_.socket());
    ASSERT_TRUE(peer.send(whole + half.substr(0, half.size() / 2)));
  }
  expectLogged("InvalidationHandler: connection exited");
  EXPECT_EQ(log().count("protocol violation"), 0U);
  EXPECT_EQ(log().count("InterruptionHandler"), 0U);
  expectServes(witness_);
  endService();
  EXPECT_THAT(store().rows("SELECT payload FROM beacon_message WHERE category <> 65535"),
              ElementsAre("{\"whole\":1}"));
}

TEST_F(QVPeerPressureTest, APeerThatOnlyStopsSendingIsHeardToTheEnd) {
  QVRawPeer peer(root_.socket());
  const uint32_t serial = peer.post(createCall(7));
  peer.finishSending();
  peer.awaitClose();
  EXPECT_EQ(serial, 1U);
  expectLogged("created reporting session for ID: 7");
  expectServes(witness_);
}

TEST_F(QVPeerPressureTest, HalvesOfManyMessagesDoNotAddUp) {
  // Each peer announces a message of 8 MiB and sends a little of it.
  constexpr std::size_t kPeers = 100;
  const std::string beginning =
      sendCall({{"text", std::string(std::size_t{7} << 20, 'x')}}, {7}, kSessionPlayback, kStart)
          .bytes(1)
          .substr(0, 10'000);
  const long before = service().statusNumber("status", "VmRSS");
  std::deque<QVRawPeer> peers;
  for (std::size_t i = 0; i < kPeers; ++i) {
    ASSERT_TRUE(peers.emplace_back(root_.socket()).send(beginning));
  }
  expectServes(witness_);
  if (kMemoryTells) {
    // Kilobytes: what came in, twice, and each connection's own.
    EXPECT_LT(service().statusNumber("status", "VmRSS") - before, 8 * 1024);
  }
}

TEST_F(QVPeerPressureTest, ClientsWaitWhileDescriptorsAreUsedUp) {
  std::deque<QVPeerClient> clients;
  for (int i = 0; i < 20; ++i) expectServes(clients.emplace_back(root_.socket()));
  useUpDescriptors();

  QVRawPeer waiting(root_.socket(), QVRawPeer::Opening::silent);
  waiting.send(QVRawPeer::opening() + createCall(7).bytes(1));
  expectLogged("cannot accept a connection");
  for (auto& client : clients) expectServes(client);
  EXPECT_FALSE(witness_.isValid(7));

  clients.pop_back();
  EXPECT_TRUE(waiting.receiveLine().starts_with("OK "));
  EXPECT_TRUE(waiting.awaitReply(1).boolean());
  EXPECT_EQ(log().count("cannot accept a connection"), 1U);
}

TEST_F(QVPeerPressureTest, ReportingStaysSwitchedOffHoweverManyClientsConnect) {
  root_.configure("preferences/net.quillon.quietvox.json", R"({"disable_reporting": true})");
  useUpDescriptors();
  const QVRawPeer waiting(root_.socket(), QVRawPeer::Opening::silent);
  expectLogged("cannot accept a connection");
  std::ofstream(root_.runtime() / "notify/net.quillon.quietvox.reporting").flush();
  expectLogged("defaults {\"disable_reporting\":true}");
  EXPECT_EQ(witness_.call(sendToAllCall({{"a", 1}}, kSessionPlayback, kStart)).errorName,
            "net.quillon.audio.reporting.Code1");
}

// More than the service holds of what it took in: it stops reading until the store has caught up.
TEST_F(QVPeerPressureTest, AFloodOfMessagesIsStoredWithoutGrowingTheService) {
  // Three times the bound, so that a good part would pile up even beside a store that is several
  // times as fast against the rest as any that was measured: without the bound there were between
  // 140 and 190 MiB, on one processor the least. More than this the store's file has no room for.
  constexpr int kMessages = 90'000;
  constexpr int kMessagesOfABatch = 500;
  const QVDictionary message{{"text", std::string(2000, 'x')}};
  auto call = sendToAllCall(message, kSessionPlayback, kStart);
  call.flags = kBusNoReplyExpected;
  std::string batch;
  for (int i = 0; i < kMessagesOfABatch; ++i) batch += call.bytes(1);
  for (int i = 0; i < kMessages / kMessagesOfABatch; ++i) ASSERT_TRUE(witness_.send(batch));
  expectServes(witness_);
  if (kMemoryTells) {
    // Kilobytes: the bound of 64 MiB and up to 25 MiB of everything else, as measured, and room.
    EXPECT_LT(service().statusNumber("status", "VmHWM"), 104 * 1024);
  }
  endService();
  EXPECT_EQ(store().count("beacon_message"), kMessages);
  EXPECT_EQ(store().count("loss"), 0);
}

}  // namespace
