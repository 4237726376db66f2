// Clients that come, do something and vanish: nothing of them may stay.

#include "tests/support/QVServiceFixture.h"

#include <algorithm>
#include <chrono>

namespace {

using namespace std::chrono_literals;
using testing::IsEmpty;
using Backends = QVFakeBeacon::Backends;

class QVReportingLeakTest : public QVServiceFixture {
 protected:
  static constexpr int kRounds = 1000;

  // A client with a whole session life under way, nothing of which has run yet.
  QVTestClient& busyClient(int32_t pid) {
    QVTestClient& client = connectClient(pid);
    instances_.push_back(client.instance());
    for (const int64_t reporterID : {1, 2, 3}) {
      client.create(reporterID);
      client.setServiceType(static_cast<uint16_t>(reporterID), reporterID);
      client.setConfiguration({{"HostApplicationDisplayID", "player"}}, reporterID);
      client.start(reporterID);
    }
    client.send({{"a b", 1}, {"EngineOnTime", 2}}, {1, 2, 3});
    client.sendToAll({{"c", 3}});
    return client;
  }
  void noteSessions(const QVTestClient& client) {
    for (const auto& [reporterID, session] : client.instance()->clientReportingSessionMap()) {
      sessions_.push_back(session);
    }
  }
  // Lets go of what the test itself holds.
  void forgetClients() {
    clients_.clear();
    journal_.forget();
  }
  void expectNothingLeft() {
    const auto gone = [](const auto& weak) { return weak.expired(); };
    EXPECT_TRUE(std::ranges::all_of(instances_, gone));
    EXPECT_TRUE(std::ranges::all_of(sessions_, gone));
    EXPECT_THAT(service().getAllClients(), IsEmpty());
    EXPECT_EQ(platform_.beacon().liveSessions(), 0);
    EXPECT_EQ(platform_.beacon().liveTokens(), 0);
    EXPECT_EQ(platform_.queues().pendingCount(), 0u);
    EXPECT_EQ(platform_.countwise().waitingEvents(), 0u);
    const auto codes = platform_.tracePoints().codes();
    EXPECT_EQ(std::ranges::count(codes, kTraceSessionCreated),
              std::ranges::count(codes, kTraceSessionDestroyed));
  }

  std::vector<std::weak_ptr<QVReportingServerInstance>> instances_;
  std::vector<std::weak_ptr<QVReportingSession>> sessions_;
};

TEST_F(QVReportingLeakTest, LosesNothingOfClientsThatVanishWhileTheirSessionsRun) {
  for (int round = 0; round < kRounds; ++round) {
    QVTestClient& client = busyClient(42 + round);
    runUntilIdle();
    noteSessions(client);
    client.disconnect();
    runUntilIdle();
    forgetClients();
    platform_.beacon().forgetEvents();
  }
  EXPECT_EQ(sessions_.size(), std::size_t{3 * kRounds});
  expectNothingLeft();
}

TEST_F(QVReportingLeakTest, LosesNothingOfClientsThatVanishBeforeAnythingHasRun) {
  for (int round = 0; round < kRounds; ++round) {
    busyClient(42 + round).disconnect();
    if (round % 7 == 0) runUntilIdle();
    forgetClients();
  }
  runUntilIdle();
  expectNothingLeft();
  EXPECT_EQ(platform_.beacon().count(QVFakeBeaconEvent::Kind::flush), std::size_t{3 * kRounds})
      << "what was received whole was run";
}

TEST_F(QVReportingLeakTest, LosesNothingOfClientsThatBreakTheProtocolMidway) {
  for (int round = 0; round < kRounds; ++round) {
    QVTestClient& client = busyClient(42 + round);
    if (round % 2 == 0) runServerQueue();
    client.interrupt();
    if (round % 3 == 0) runUntilIdle();
    noteSessions(client);
    client.disconnect();
    runUntilIdle();
    forgetClients();
  }
  expectNothingLeft();
}

TEST_F(QVReportingLeakTest, LosesNothingOfClientsThatVanishWhileTheyWaitForBackends) {
  platform_.beacon().setBackends(Backends::never);
  for (int round = 0; round < kRounds; ++round) {
    QVTestClient& client = busyClient(42 + round);
    platform_.queues().after(1s, [&] {
      noteSessions(client);
      client.disconnect();
    });
    runUntilIdle();
    forgetClients();
    platform_.log().clear();
  }
  EXPECT_EQ(sessions_.size(), std::size_t{3 * kRounds});
  expectNothingLeft();
}

TEST_F(QVReportingLeakTest, LosesNothingOfSessionsThatAreReplacedAndDestroyed) {
  QVTestClient& client = connectClient(42);
  instances_.push_back(client.instance());
  for (int round = 0; round < kRounds; ++round) {
    client.create(1);
    client.start(1);
    client.send({{"a", 1}}, {1});
    runUntilIdle();
    noteSessions(client);
    if (round % 2 == 0) client.destroy(1);
    runUntilIdle();
  }
  client.disconnect();
  runUntilIdle();
  EXPECT_EQ(sessions_.size(), std::size_t{kRounds});
  expectNothingLeft();
}

TEST_F(QVReportingLeakTest, LetsGoOfRepliesThatAreNeverCalled) {
  const auto held = std::make_shared<int>();
  for (int round = 0; round < kRounds; ++round) {
    QVTestClient& client = connectClient(42);
    client.create(1);
    client.connection().call().startReportingSessionForID(1, [held](bool) { FAIL(); });
    runUntilIdle();
    EXPECT_EQ(held.use_count(), 2);
    client.disconnect();
    runUntilIdle();
    forgetClients();
  }
  EXPECT_EQ(held.use_count(), 1);
}

}  // namespace
