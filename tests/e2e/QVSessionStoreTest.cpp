// What a session's life leaves in the event store.

#include "tests/support/QVEndToEndTest.h"
#include "tests/support/QVSubprocess.h"

#include <chrono>

#include <gmock/gmock.h>

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::MatchesRegex;
using ::testing::UnorderedElementsAre;

constexpr uint16_t kTelephony = 2;
constexpr uint16_t kHaptics = 3;
constexpr uint16_t kTest = 11;
constexpr uint16_t kAPIUsage = 12;

constexpr const char* kMessages =
    "SELECT session_id, client_name, service_name, category, type, payload FROM beacon_message "
    "ORDER BY id";
constexpr const char* kCountwiseMessages =
    "SELECT name, payload FROM countwise_event WHERE name NOT LIKE '%uptime' ORDER BY id";

int64_t microsecondsNow() {
  return std::chrono::duration_cast<std::chrono::microseconds>(
             std::chrono::system_clock::now().time_since_epoch())
      .count();
}

class QVSessionStoreTest : public QVEndToEndTest {};

TEST_F(QVSessionStoreTest, KeepsASessionWithItsInformation) {
  const int64_t before = microsecondsNow();
  auto client = connectClient();
  client.create(7, kTelephony);
  client.configure({{"HostApplicationDisplayID", "net.example.player"}, {"rate", 48000}}, 7);
  client.start(7);
  client.sendMessage({{"a", 1}}, {7});
  client.stop(7);
  endService();
  const int64_t after = microsecondsNow();

  EXPECT_THAT(store().rows("SELECT session_id, client_type, client_version, batch_event, "
                           "contains_realtime_events, user_info FROM beacon_session"),
              ElementsAre("7|19|2.0|1|0|"
                          R"({"HostApplicationDisplayID":"net.example.player",)"
                          R"("kBeaconUserInfoClientName":"net.quillon.quietvox",)"
                          R"("kBeaconUserInfoServiceName":"telephony_session","rate":48000})"));
  EXPECT_NE(store().rows("SELECT token FROM beacon_session"), std::vector<std::string>{""});
  const int64_t opened = store().number("SELECT opened_at FROM beacon_session");
  const int64_t sent = store().number("SELECT min(sent_at) FROM beacon_message");
  const int64_t flushed = store().number("SELECT flushed_at FROM beacon_session");
  EXPECT_LE(before, opened);
  EXPECT_LE(opened, sent);
  EXPECT_LE(sent, flushed);
  EXPECT_LE(flushed, after);
}

TEST_F(QVSessionStoreTest, KeepsMessagesNormalisedAndTheirSummary) {
  auto client = connectClient();
  client.create(7, kTelephony);
  client.start(7);
  client.sendMessage({{"buffer size", 512}, {"note", "a b"}, {"load", 0.25}}, {7});
  client.sendMessage({{"buffer size", 1024}, {"on", true}, {"list", QVArray{1, "x", 2.0}}}, {7},
                     0x40000007, 0);
  client.stop(7);
  endService();

  EXPECT_THAT(store().rows(kMessages),
              ElementsAre("7|net.quillon.quietvox|telephony_session|3|1|"
                          R"({"buffer_size":512,"load":0.25,"note":"a b"})",
                          "7|net.quillon.quietvox|telephony_session|7|0|"
                          R"({"buffer_size":1024,"list":[1,"x",2.0],"on":true})",
                          "7|net.quillon.quietvox|telephony_session|65535|65535|"
                          R"({"QV_Session_Summary_Event":"2","buffer_size":"512,1024",)"
                          R"("list":"[1,\"x\",2]","load":"0.25","note":"a b","on":"1"})"));
  EXPECT_EQ(store().number("SELECT count(*) FROM beacon_message m JOIN beacon_session s "
                           "ON m.session = s.id WHERE s.session_id = 7"),
            3);
}

TEST_F(QVSessionStoreTest, KeepsAnAnalyticsEventForEachMessageToASession) {
  auto client = connectClient();
  client.create(7, kTelephony);
  client.configure({{"HostApplicationDisplayID", "net.example.player"}}, 7);
  client.start(7);
  // The keys of analytics events keep their blanks; a client's own application name is replaced.
  client.sendMessage({{"buffer size", 512}, {"HostApplicationDisplayID", "someone else"}}, {7});
  client.sendMessage({}, {7}, 0x18000001, 9);
  client.stop(7);
  endService();

  EXPECT_THAT(store().rows(kCountwiseMessages),
              ElementsAre("net.quillon.quietvox.Session_Playback.Start|"
                          R"({"HostApplicationDisplayID":"net.example.player","buffer size":512})",
                          "net.quillon.quietvox._Generic.Undefined|"
                          R"({"HostApplicationDisplayID":"net.example.player"})"));
}

TEST_F(QVSessionStoreTest, KeepsAPowerEventForEachEngineRun) {
  auto client = connectClient();
  client.create(7, kHaptics);
  client.configure({{"HostApplicationDisplayID", "net.example.player"}}, 7);
  client.start(7);
  client.sendMessage({{"EngineOnTime", 12.5}, {"qvreporting_timestamp", 1000}}, {7});
  client.sendMessage({{"EngineOnTime", 3}}, {7});
  client.sendMessage({{"qvreporting_timestamp", 2000}}, {7});
  client.stop(7);
  endService();

  EXPECT_THAT(store().rows("SELECT agent, name, payload FROM joulewell_event ORDER BY id"),
              ElementsAre("28|Vidra_Haptics|"
                          R"({"ApplicationName":"net.example.player","EngineOnDuration":12.5,)"
                          R"("TimestampEnd":1000})",
                          "28|Vidra_Haptics|"
                          R"({"ApplicationName":"net.example.player","EngineOnDuration":3})"));
  EXPECT_EQ(log().count("failed to get QVReporting timestamp for joulewell"), 1U);
}

TEST_F(QVSessionStoreTest, KeepsAMessageForNobodyAsAStandaloneOne) {
  auto client = connectClient();
  client.create(7, kTelephony);  // not started
  client.sendToAll({{"buffer size", 512}}, 0x00010005, 2);
  endService();

  EXPECT_THAT(store().rows(kMessages),
              ElementsAre("-1|net.quillon.quietvox|standalone|5|2|{\"buffer_size\":512}"));
  EXPECT_EQ(store().number("SELECT count(*) FROM beacon_message WHERE session IS NULL"), 1);
  EXPECT_EQ(store().count("beacon_session"), 0);
  EXPECT_THAT(store().rows(kCountwiseMessages), IsEmpty());
}

TEST_F(QVSessionStoreTest, KeepsNothingOfAMessageToAnEmptyList) {
  auto client = connectClient();
  client.create(7, kTelephony);
  client.start(7);
  client.sendMessage({{"a", 1}}, {});
  client.sendMessage({{"a", 1}}, {0, 8});  // nobody has these
  endService();

  EXPECT_EQ(store().count("beacon_message"), 0);
  EXPECT_THAT(store().rows(kCountwiseMessages), IsEmpty());
}

TEST_F(QVSessionStoreTest, BroadcastsToStartedSessionsOfAllProcesses) {
  auto first = connectClient();
  auto second = connectClient();
  first.create(1, kTelephony);
  first.create(2, kTelephony);
  second.create(3, kHaptics);
  first.start(1);
  second.start(3);
  const auto sent = QVSubprocess::run(
      {"busctl", "--address=" + address(), "call", "net.quillon.quietvox",
       "/net/quillon/quietvox/ReportingService", "net.quillon.quietvox.ReportingService",
       "SendMessage", "a{sv}uqbax", "1", "a", "i", "1", "134217731", "1", "true", "0"});
  EXPECT_EQ(sent.status, 0) << sent.text;
  first.awaitOperations();
  endService();

  EXPECT_THAT(store().rows("SELECT session_id, payload FROM beacon_message "
                           "WHERE category <> 65535"),
              UnorderedElementsAre("1|{\"a\":1}", "3|{\"a\":1}"));
  EXPECT_EQ(store().rows(kCountwiseMessages).size(), 2U);
}

TEST_F(QVSessionStoreTest, LetsAClientAddressAnotherClientsSession) {
  auto owner = connectClient();
  auto other = connectClient();
  owner.create(7, kTelephony);
  other.start(7);
  other.sendMessage({{"a", 1}}, {7});
  EXPECT_EQ(other.serviceType(7), kTelephony);
  EXPECT_TRUE(other.isValid(7));
  EXPECT_THAT(other.reporters(), ElementsAre(7));
  // What only the owner may do is acknowledged all the same.
  other.setServiceType(kHaptics, 7);
  other.stop(7);
  other.destroy(7);
  EXPECT_EQ(owner.serviceType(7), kTelephony);
  EXPECT_TRUE(owner.isValid(7));
  other.sendMessage({{"a", 2}}, {7});
  endService();

  EXPECT_THAT(store().rows("SELECT session_id, payload FROM beacon_message "
                           "WHERE category <> 65535 ORDER BY id"),
              ElementsAre("7|{\"a\":1}", "7|{\"a\":2}"));
}

TEST_F(QVSessionStoreTest, KeepsMessagesToAStoppedSessionAsSingleOnes) {
  auto client = connectClient();
  client.create(7, kTelephony);
  client.start(7);
  client.stop(7);
  client.sendMessage({{"a", 1}}, {7});
  endService();

  EXPECT_THAT(store().rows(kMessages),
              ElementsAre("-1|net.quillon.quietvox|telephony|3|1|{\"a\":1}"));
  EXPECT_EQ(store().count("beacon_session"), 1);
}

TEST_F(QVSessionStoreTest, OpensANewSessionForEachStart) {
  auto client = connectClient();
  client.create(7, kTelephony);
  for (const int round : {1, 2}) {
    client.start(7);
    client.sendMessage({{"round", round}}, {7});
    client.stop(7);
  }
  endService();

  EXPECT_EQ(store().number("SELECT count(DISTINCT token) FROM beacon_session "
                           "WHERE session_id = 7 AND flushed_at IS NOT NULL"),
            2);
  EXPECT_THAT(store().rows("SELECT payload FROM beacon_message ORDER BY session, id"),
              ElementsAre(R"({"round":1})", R"({"QV_Session_Summary_Event":"2","round":"1"})",
                          R"({"round":2})", R"({"QV_Session_Summary_Event":"2","round":"2"})"));
}

TEST_F(QVSessionStoreTest, KeepsTestSessionsOutOfTheFramework) {
  auto client = connectClient();
  client.create(7, kTest);
  client.start(7);
  client.sendMessage({{"a", 1}}, {7});
  client.stop(7);
  endService();

  EXPECT_EQ(store().count("beacon_session"), 0);
  EXPECT_EQ(store().count("beacon_message"), 0);
  EXPECT_EQ(store().rows(kCountwiseMessages).size(), 1U);
  // The message and the summary.
  EXPECT_EQ(log().count("transactions aren't allowed on this platform"), 2U);
}

TEST_F(QVSessionStoreTest, CommitsMessagesOfRealtimeSessionsWhileTheyRun) {
  auto client = connectClient();
  client.create(7, kAPIUsage);
  client.start(7);
  client.sendMessage({{"a", 1}}, {7});

  expectStored("SELECT * FROM beacon_message WHERE session_id = 7", 1);
  EXPECT_THAT(store().rows("SELECT batch_event, contains_realtime_events FROM beacon_session"),
              ElementsAre("0|1"));
  EXPECT_THAT(store().rows(kMessages),
              ElementsAre("7|net.quillon.quietvox|apiusage_session|3|1|{\"a\":1}"));
  endService();
}

TEST_F(QVSessionStoreTest, SumsUpSessionsOfAClientThatDisconnects) {
  auto witness = connectClient();
  {
    auto client = connectClient();
    client.create(7, kTelephony);
    client.start(7);
    client.sendMessage({{"a", 1}}, {7});
  }
  expectLogged("removing " + std::to_string(::getpid()) + " from the server client list");
  EXPECT_FALSE(witness.isValid(7));
  endService();

  EXPECT_THAT(store().rows("SELECT category, payload FROM beacon_message ORDER BY id"),
              ElementsAre("3|{\"a\":1}", R"(65535|{"QV_Session_Summary_Event":"2","a":"1"})"));
}

TEST_F(QVSessionStoreTest, KeepsTheUptimeOfAClientThatDisconnects) {
  auto witness = connectClient();
  {
    auto client = connectClient();
    client.awaitOperations();
  }
  expectLogged("InvalidationHandler: connection exited process=qv_e2e_tests uptime_sec=");
  expectStored("SELECT * FROM countwise_event", 1);
  EXPECT_THAT(store().rows("SELECT name, payload FROM countwise_event"),
              ElementsAre(MatchesRegex(R"(net\.quillon\.quietvox\.qvreportingclientuptime\|)"
                                       R"(\{"processName":"qv_e2e_tests","seconds":[0-9.e-]+\})")));
  endService();
  // The witness was a client, too.
  EXPECT_EQ(store().count("countwise_event"), 2);
}

}  // namespace
