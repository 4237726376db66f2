// Clients that start something and vanish, again and again: nothing of them is left.

#include "tests/support/QVEndToEndTest.h"

#include <gmock/gmock.h>

namespace {

using ::testing::IsEmpty;

constexpr uint16_t kTelephony = 2;
// Rounds in which what is made only once is made, and those that count.
constexpr std::size_t kFirstRounds = 500;
constexpr std::size_t kRounds = kFirstRounds + 1000;
// So often the test waits for the service to have got rid of everybody: that keeps the log's queue
// from overflowing, and so the count of its lines exact.
constexpr std::size_t kRoundsBetween = 50;

class QVVanishingClientsTest : public QVEndToEndTest {
 protected:
  // Everything at once, without waiting for any reply: the peer is gone before most of it runs.
  // What it says is large enough to show where it is kept.
  void startAndVanish() const {
    const std::string text(4000, 'x');
    QVRawPeer peer(root_.socket(), QVRawPeer::Opening::silent);
    ASSERT_TRUE(peer.send(QVRawPeer::opening() + createCall(7).bytes(1) +
                          setServiceTypeCall(kTelephony, 7).bytes(2) +
                          configureCall({{"text", text}}, 7).bytes(3) + startCall(7).bytes(4) +
                          sendCall({{"text", text}}, {7}, kSessionPlayback, kStart).bytes(5)));
  }
  void vanishInRounds(std::size_t from, std::size_t to) {
    for (std::size_t round = from + 1; round <= to; ++round) {
      startAndVanish();
      if (round % kRoundsBetween != 0) continue;
      expectLogged("dealloc ", round);
      expectLogged("deallocing this session", round);
    }
  }
};

// Each has told how long it was there, although it was gone before it was looked at.
TEST_F(QVVanishingClientsTest, TellTheirUptime) {
  constexpr std::size_t kClients = 50;
  startService({});
  for (std::size_t i = 0; i < kClients; ++i) startAndVanish();
  expectLogged("dealloc ", kClients);
  EXPECT_EQ(log().count("clientStartDate is nil"), 0U);
  EXPECT_EQ(log().count("clientProcessName is nil"), 0U);
  endService();
  EXPECT_EQ(store()
                .rows("SELECT id FROM countwise_event "
                      "WHERE name = 'net.quillon.quietvox.qvreportingclientuptime'")
                .size(),
            kClients);
}

TEST_F(QVVanishingClientsTest, LeaveNothing) {
  auto witness = connectClient();
  vanishInRounds(0, kFirstRounds);
  expectServes(witness);
  const std::size_t descriptors = service().openDescriptors();
  const long memory = service().statusNumber("status", "VmRSS");
  vanishInRounds(kFirstRounds, kRounds);

  EXPECT_THAT(witness.reporters(), IsEmpty());
  EXPECT_EQ(service().openDescriptors(), descriptors);
  if (kMemoryTells) {
    // Kilobytes. A text that stayed behind in each round would take more.
    EXPECT_LT(service().statusNumber("status", "VmRSS") - memory, 3 * 1024);
  }
  EXPECT_EQ(log().count("new client with pid"), kRounds + 1);
  EXPECT_EQ(log().count("created reporting session for ID: 7"), kRounds);
  EXPECT_EQ(log().count("log lines were lost"), 0U);
  endService();
  EXPECT_EQ(log().count("dealloc "), kRounds + 1);
  // Each was stopped with a summary before it went.
  EXPECT_EQ(store().number("SELECT count(*) FROM beacon_session WHERE flushed_at IS NOT NULL"),
            static_cast<int64_t>(kRounds));
  EXPECT_EQ(store().count("beacon_message"), static_cast<int64_t>(2 * kRounds));
  // A client that was gone before it was registered has no name, and no uptime.
  EXPECT_EQ(store().number("SELECT count(*) FROM countwise_event WHERE name LIKE '%uptime'") +
                static_cast<int64_t>(log().count("clientProcessName is nil")),
            static_cast<int64_t>(kRounds + 1));
}

}  // namespace
