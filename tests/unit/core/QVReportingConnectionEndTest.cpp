// What the service writes, and tells the analytics event service, when a connection ends.

#include "tests/support/QVServiceFixture.h"
#include "tests/unit/core/QVLogDetour.h"

#include <chrono>

namespace {

using namespace std::chrono_literals;
using enum QVLogLevel;
using testing::ElementsAre;
using testing::IsEmpty;

constexpr const char* kUptimeEvent = "net.quillon.quietvox.qvreportingclientuptime";

std::string handlerLine(std::string_view text) {
  return hostLine(standard, "listener:shouldAcceptNewConnection:", text);
}
std::string removalLine(int32_t pid) {
  return clientLine(standard, "handleConnectionError",
                    QVText("removing ", pid, " from the server client list"));
}
std::string destructionLine(int32_t pid) {
  return clientLine(standard, "dealloc", QVText("dealloc ", pid, " from the server client list"));
}

class QVReportingConnectionEndTest : public QVServiceFixture {
 protected:
  QVReportingConnectionEndTest() { platform_.process().addProcess(42, "player"); }

  // From now on notes before each line how many items wait on the server queue.
  void noteWaitingItems() {
    QVLogDetour::install([this](std::string_view) {
      journal_.note(QVText(platform_.queues().pendingCount(kServerQueue), " waiting"));
    });
  }
  std::vector<QVFakeCountwise::Event> events() { return platform_.countwise().events(); }
};

TEST_F(QVReportingConnectionEndTest, TellsTheUptimeWhenAConnectionIsInvalidated) {
  QVTestClient& client = registeredClient(42);
  advance(12900ms);
  client.disconnect();
  EXPECT_THAT(takeJournal(),
              ElementsAre(handlerLine("InvalidationHandler: connection exited process=player "
                                      "uptime_sec=12"),
                          std::string("countwise ") + kUptimeEvent));
  ASSERT_EQ(events().size(), 1u);
  EXPECT_EQ(events()[0].name, kUptimeEvent);
  EXPECT_EQ(events()[0].payload, (QVDictionary{{"processName", "player"}, {"seconds", 12.9}}));
  runUntilIdle();
  EXPECT_THAT(takeJournal(), ElementsAre(removalLine(42), destructionLine(42)));
  EXPECT_THAT(service().getAllClients(), IsEmpty());
}

TEST_F(QVReportingConnectionEndTest, LeavesTheUptimeEventsPayloadToWhoWantsIt) {
  platform_.countwise().addUnwanted(kUptimeEvent);
  registeredClient(42).disconnect();
  EXPECT_THAT(platform_.countwise().sentNames(), ElementsAre(kUptimeEvent));
  EXPECT_THAT(events(), IsEmpty());
}

TEST_F(QVReportingConnectionEndTest, AnswersForThePayloadAlsoAfterTheClientIsGone) {
  platform_.countwise().setDelivery(QVFakeCountwise::Delivery::whenTold);
  QVTestClient& client = registeredClient(42);
  const std::weak_ptr<QVReportingServerInstance> instance = client.instance();
  client.disconnect();
  runUntilIdle();
  EXPECT_TRUE(instance.expired());
  platform_.countwise().deliver();
  ASSERT_EQ(events().size(), 1u);
  EXPECT_EQ(events()[0].payload, (QVDictionary{{"processName", "player"}, {"seconds", 0.0}}));
}

TEST_F(QVReportingConnectionEndTest, SendsNoUptimeEventOfAProcessWithoutAName) {
  QVTestClient& client = registeredClient(0);
  advance(2s);
  client.disconnect();
  EXPECT_THAT(takeJournal(),
              ElementsAre(handlerLine("InvalidationHandler: connection exited process=(null) "
                                      "uptime_sec=2"),
                          handlerLine("clientProcessName is nil. clientpid=0")));
  EXPECT_THAT(platform_.countwise().sentNames(), IsEmpty());
}

TEST_F(QVReportingConnectionEndTest, CountsAClientWhoseStartLiesInTheFuture) {
  QVTestClient& client = registeredClient(42);
  platform_.clock().setCurrentDate(QVFakeClock::kStart - 1500ms);
  client.disconnect();
  EXPECT_THAT(takeJournal(),
              ElementsAre(handlerLine("clientStartDate is in the past. clientpid=42 "
                                      "clientprocessname=player"),
                          handlerLine("InvalidationHandler: connection exited process=player "
                                      "uptime_sec=1"),
                          std::string("countwise ") + kUptimeEvent));
  EXPECT_EQ(events().at(0).payload, (QVDictionary{{"processName", "player"}, {"seconds", 1.5}}));
}

TEST_F(QVReportingConnectionEndTest, SaysUnknownOfAFutureStartWithoutAName) {
  QVTestClient& client = registeredClient(43);
  platform_.clock().setCurrentDate(QVFakeClock::kStart - 1ns);
  client.disconnect();
  EXPECT_THAT(takeJournal(),
              ElementsAre(handlerLine("clientStartDate is in the past. clientpid=43 "
                                      "clientprocessname=unknown"),
                          handlerLine("InvalidationHandler: connection exited process=(null) "
                                      "uptime_sec=0"),
                          handlerLine("clientProcessName is nil. clientpid=43")));
}

TEST_F(QVReportingConnectionEndTest, SaturatesAnUptimeOfACenturyInTheLineOnly) {
  QVTestClient& client = registeredClient(42);
  platform_.clock().setCurrentDate(QVFakeClock::kStart + std::chrono::seconds(3'000'000'000));
  client.disconnect();
  EXPECT_EQ(takeJournal().at(0),
            handlerLine("InvalidationHandler: connection exited process=player "
                        "uptime_sec=2147483647"));
  EXPECT_EQ(events().at(0).payload, (QVDictionary{{"processName", "player"}, {"seconds", 3e9}}));
}

TEST_F(QVReportingConnectionEndTest, SaysThatAClientHadNotBeenRegistered) {
  QVTestClient& client = connectClient(42);
  takeJournal();
  client.disconnect();
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(handlerLine("clientStartDate is nil. clientpid=42 clientprocessname=unknown"),
                  handlerLine("InvalidationHandler: connection exited process=(null) "
                              "uptime_sec=-1"),
                  handlerLine("clientProcessName is nil. clientpid=42")));
  runUntilIdle();
  EXPECT_THAT(takeJournal(), ElementsAre(removalLine(42), destructionLine(42)))
      << "registered first, then removed";
  EXPECT_THAT(service().getAllClients(), IsEmpty());
}

TEST_F(QVReportingConnectionEndTest, SendsMinusOneSecondsOfANamedClientWithoutAStartDate) {
  QVTestClient& client = connectClient(42);
  client.instance()->setClientProcessName("player");
  takeJournal();
  client.disconnect();
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(handlerLine("clientStartDate is nil. clientpid=42 clientprocessname=player"),
                  handlerLine("InvalidationHandler: connection exited process=player "
                              "uptime_sec=-1"),
                  std::string("countwise ") + kUptimeEvent));
  EXPECT_EQ(events().at(0).payload, (QVDictionary{{"processName", "player"}, {"seconds", -1}}));
}

TEST_F(QVReportingConnectionEndTest, WritesTheSameOfAClientThatIsGone) {
  QVTestClient& client = connectClient(42);
  client.connection().setExportedObject(nullptr);
  runUntilIdle();
  takeJournal();
  client.interrupt();
  client.disconnect();
  runUntilIdle();
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(handlerLine("InterruptionHandler: connection exited"),
                  handlerLine("clientStartDate is nil. clientpid=42 clientprocessname=unknown"),
                  handlerLine("InvalidationHandler: connection exited process=(null) "
                              "uptime_sec=-1"),
                  handlerLine("clientProcessName is nil. clientpid=42")));
}

TEST_F(QVReportingConnectionEndTest, RemovesAnInterruptedAndInvalidatedClientOnce) {
  QVTestClient& client = clientWithStartedSession(42, 7);
  client.interrupt();
  EXPECT_THAT(takeJournal(), ElementsAre(handlerLine("InterruptionHandler: connection exited")));
  client.disconnect();
  EXPECT_EQ(platform_.queues().pendingCount(kServerQueue), 2u);
  EXPECT_THAT(takeJournal(),
              ElementsAre(handlerLine("InvalidationHandler: connection exited process=player "
                                      "uptime_sec=0"),
                          std::string("countwise ") + kUptimeEvent));
  runUntilIdle();
  EXPECT_THAT(takeJournal(),
              ElementsAre(traceEntry(kTraceSessionStopped), removalLine(42), destructionLine(42),
                          sessionLine(info, "dealloc", "deallocing this session 7"),
                          traceEntry(kTraceSessionDestroyed)));
}

TEST_F(QVReportingConnectionEndTest, WritesOfAnInterruptionBeforeItHandsOnTheRemoval) {
  QVTestClient& client = registeredClient(42);
  noteWaitingItems();
  client.interrupt();
  EXPECT_THAT(takeJournal(),
              ElementsAre("0 waiting", handlerLine("InterruptionHandler: connection exited")));
  EXPECT_EQ(platform_.queues().pendingCount(kServerQueue), 1u);
}

TEST_F(QVReportingConnectionEndTest, HandsOnTheRemovalBeforeItWritesOfAnInvalidation) {
  QVTestClient& client = registeredClient(42);
  platform_.clock().setCurrentDate(QVFakeClock::kStart - 1500ms);
  noteWaitingItems();
  client.disconnect();
  EXPECT_THAT(takeJournal(),
              ElementsAre("1 waiting",
                          handlerLine("clientStartDate is in the past. clientpid=42 "
                                      "clientprocessname=player"),
                          "1 waiting",
                          handlerLine("InvalidationHandler: connection exited process=player "
                                      "uptime_sec=1"),
                          std::string("countwise ") + kUptimeEvent));
}

TEST_F(QVReportingConnectionEndTest, RemovesAnInterruptedClientWhoseConnectionLingers) {
  QVTestClient& client = registeredClient(42);
  client.interrupt();
  runUntilIdle();
  EXPECT_THAT(takeJournal(),
              ElementsAre(handlerLine("InterruptionHandler: connection exited"), removalLine(42)));
  EXPECT_NE(client.instance(), nullptr);
  EXPECT_THAT(platform_.countwise().sentNames(), IsEmpty());
}

TEST_F(QVReportingConnectionEndTest, RunsWhatWasReceivedBeforeTheEnd) {
  QVTestClient& client = registeredClient(42);
  client.create(7);
  client.start(7);
  client.send({{"a", 1}}, {7});
  client.disconnect();
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(),
              ElementsAre("session 1", "configuration 1", R"(message 1: 3/1 {"a":1})",
                          R"(message 1: 65535/65535 {"QV_Session_Summary_Event":"65535","a":"1"})",
                          "flush 1", "end 1"));
}

TEST_F(QVReportingConnectionEndTest, EndsEveryClientWithTheService) {
  QVTestClient& first = clientWithStartedSession(42, 7);
  QVTestClient& second = clientWithStartedSession(43, 8);
  platform_.listener().resume();
  runUntilIdle();
  EXPECT_TRUE(first.connection().isInvalidated());
  EXPECT_TRUE(second.connection().isInvalidated());
  EXPECT_THAT(service().getAllClients(), IsEmpty());
  EXPECT_EQ(platform_.beacon().count(QVFakeBeaconEvent::Kind::flush), 2u);
}

}  // namespace
