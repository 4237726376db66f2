// Who starts a session, what is read at the start, and when the start is answered.

#include "tests/support/QVServiceFixture.h"

#include <chrono>

namespace {

using namespace std::chrono_literals;
using enum QVLogLevel;
using testing::ElementsAre;
using testing::IsEmpty;

constexpr std::string_view kStop = "stopReportingSessionForID:reply:";

class QVReportingStartReplyTest : public QVServiceFixture {
 protected:
  // What a stop by client 42 tells that answers a waiting start.
  static auto storyOfStop(std::string answer) {
    return ElementsAre(traceEntry(kTraceStop),
                       clientLine(standard, kStop, "nothing interesting to fetch from the drivers"),
                       traceEntry(kTraceSessionStopped), std::move(answer),
                       clientLine(standard, kStop, "stopping 7"),
                       std::string("reply 42 stop 7: YES"));
  }
};

TEST_F(QVReportingStartReplyTest, AnswersAStartWithTheStop) {
  QVTestClient& client = clientWithSession(42, 7);
  client.start(7);
  advance(1h);
  EXPECT_TRUE(client.session(7)->started());
  EXPECT_THAT(replies(), IsEmpty()) << "whatever time passes";
  client.stop(7);
  runUntilIdle();
  EXPECT_THAT(replies(), ElementsAre("reply 42 start 7: YES", "reply 42 stop 7: YES"));
}

TEST_F(QVReportingStartReplyTest, MarksTheStartOnTheServerQueueAndInTheSession) {
  QVTestClient& client = clientWithSession(42, 7);
  client.start(7);
  EXPECT_THAT(takeJournal(), IsEmpty());
  runServerQueue();
  EXPECT_THAT(takeJournal(),
              ElementsAre(traceEntry(kTraceStart), traceEntry(kTraceSessionStarted)));
  EXPECT_NE(client.session(7)->driverSnapShot(), nullptr);
}

TEST_F(QVReportingStartReplyTest, AnswersAtOnceForASessionThatIsStarted) {
  QVTestClient& client = clientWithStartedSession(42, 7);
  client.start(7);
  runUntilIdle();
  EXPECT_THAT(takeJournal(), ElementsAre(traceEntry(kTraceStart), "reply 42 start 7: YES"));
  client.stop(7);
  runUntilIdle();
  EXPECT_THAT(replies(), ElementsAre("reply 42 start 7: YES", "reply 42 stop 7: YES"))
      << "the first start was still waiting";
}

TEST_F(QVReportingStartReplyTest, AnswersAtOnceForASessionThatNobodyHas) {
  QVTestClient& client = clientWithSession(42, 7);
  client.start(8);
  runUntilIdle();
  EXPECT_THAT(takeJournal(),
              ElementsAre(traceEntry(kTraceStart), lookupFailure(8), "reply 42 start 8: YES"));
}

TEST_F(QVReportingStartReplyTest, StartsAnotherClientsSession) {
  QVTestClient& owner = clientWithSession(42, 7);
  QVTestClient& other = registeredClient(43);
  other.start(7);
  runServerQueue();
  EXPECT_TRUE(owner.session(7)->started());
  EXPECT_THAT(takeJournal(), ElementsAre(traceEntry(kTraceStart), lookupHit(7, 42),
                                         traceEntry(kTraceSessionStarted)));
  runUntilIdle();
  EXPECT_THAT(replies(), IsEmpty());
  journal_.forget();
  owner.stop(7);
  runUntilIdle();
  EXPECT_THAT(takeJournal(), storyOfStop("reply 43 start 7: YES"));
}

TEST_F(QVReportingStartReplyTest, AnswersAWaitingStartWhenALaterOneFindsIt) {
  QVTestClient& owner = clientWithStartedSession(42, 7);
  QVTestClient& other = registeredClient(43);
  // Stopped behind the operation's back, as a broken connection stops it: the reply keeps waiting.
  owner.session(7)->stop();
  takeJournal();
  other.start(7);
  runServerQueue();
  EXPECT_THAT(takeJournal(),
              ElementsAre(traceEntry(kTraceStart), lookupHit(7, 42),
                          traceEntry(kTraceSessionStarted), "reply 42 start 7: YES"));
  runUntilIdle();
  EXPECT_THAT(replies(), IsEmpty());
  journal_.forget();
  owner.stop(7);
  runUntilIdle();
  EXPECT_THAT(takeJournal(), storyOfStop("reply 43 start 7: YES"));
}

TEST_F(QVReportingStartReplyTest, AnswersAWaitingStartAlsoWhenTheSessionIsAlreadyStopped) {
  QVTestClient& client = clientWithStartedSession(42, 7);
  client.session(7)->stop();
  client.stop(7);
  runUntilIdle();
  EXPECT_THAT(replies(), ElementsAre("reply 42 start 7: YES", "reply 42 stop 7: YES"));
  client.stop(7);
  runUntilIdle();
  EXPECT_EQ(replies().back(), "reply 42 stop 7: YES") << "answered once only";
  EXPECT_EQ(replies().size(), 3u);
}

TEST_F(QVReportingStartReplyTest, NeverAnswersForADestroyedSession) {
  QVTestClient& client = clientWithStartedSession(42, 7);
  client.destroy(7);
  client.stop(7);
  client.create(7);
  client.start(7);
  client.stop(7);
  runUntilIdle();
  EXPECT_THAT(replies(), ElementsAre("reply 42 destroy 7: YES", "reply 42 stop 7: YES",
                                     "reply 42 create 7: YES", "reply 42 start 7: YES",
                                     "reply 42 stop 7: YES"))
      << "the one start that is answered is the second session's";
}

TEST_F(QVReportingStartReplyTest, NeverAnswersForAReplacedSession) {
  QVTestClient& client = clientWithStartedSession(42, 7);
  client.create(7);
  client.stop(7);
  runUntilIdle();
  EXPECT_THAT(replies(), ElementsAre("reply 42 create 7: YES", "reply 42 stop 7: YES"));
}

TEST_F(QVReportingStartReplyTest, NeverAnswersForASessionWhoseOwnerVanished) {
  QVTestClient& owner = clientWithSession(42, 7);
  QVTestClient& other = connectClient(43);
  other.start(7);
  runUntilIdle();
  owner.disconnect();
  runUntilIdle();
  EXPECT_THAT(replies(), IsEmpty());
  other.stop(7);
  other.start(7);
  runUntilIdle();
  EXPECT_THAT(replies(), ElementsAre("reply 43 stop 7: YES", "reply 43 start 7: YES"));
}

TEST_F(QVReportingStartReplyTest, KeepsTheReplyInTheSessionUntilTheStop) {
  QVTestClient& client = clientWithSession(42, 7);
  const auto session = client.session(7);
  client.start(7);
  runServerQueue();
  EXPECT_TRUE(session->transactionCompleteBlock());
  client.stop(7);
  runServerQueue();
  EXPECT_FALSE(session->transactionCompleteBlock());
}

// A service delegate whose drivers count what the test says, and that notes when it is asked for a
// snapshot.
class DrivingDelegate final : public QVReportingServiceDelegateProtocol {
 public:
  explicit DrivingDelegate(QVJournal& journal) : journal_(journal) {}

  QVDictionary getDefaults() const override { return {}; }
  const Clients& getAllClients() const override { return clients; }
  bool isReportingEnabled() const override { return true; }
  std::shared_ptr<QVReportingSession> findReportingSessionForID(int64_t) const override {
    return nullptr;
  }
  SnapShot getSnapShot() const override {
    journal_.note("snapshot taken");
    return snapShot;
  }
  QVDictionary getDriverStatisticsRelativeToSnapShot(const SnapShot& relative) const override {
    asked.push_back(relative);
    return grown;
  }
  void removeClient(const QVReportingServerInstance&) override {}

  Clients clients;
  SnapShot snapShot = std::make_shared<QVReportingDriverSnapShot>();
  QVDictionary grown;
  mutable std::vector<SnapShot> asked;

 private:
  QVJournal& journal_;
};

class QVReportingDriverStatisticsTest : public QVServiceFixture {
 protected:
  QVReportingDriverStatisticsTest() {
    service();  // for the server queue
    connection_->setExportedInterface(QVIPCInterface::reportingService);
    connection_->setExportedObject(QVReportingServerInstance::initWithPID(42, delegate_));
    connection_->resume();
    client_.create(7);
    client_.start(7);
    runUntilIdle();
    takeBeaconStory();
    journal_.forget();
  }
  void stop() {
    client_.stop(7);
    runUntilIdle();
  }
  std::shared_ptr<QVReportingSession> session() const { return client_.session(7); }

  std::shared_ptr<DrivingDelegate> delegate_ = std::make_shared<DrivingDelegate>(journal_);
  std::shared_ptr<QVFakeIPCConnection> connection_ = std::make_shared<QVFakeIPCConnection>(42, 1);
  QVTestClient client_{connection_, journal_};
};

TEST_F(QVReportingDriverStatisticsTest, KeepsTheSnapShotOfTheStart) {
  EXPECT_EQ(session()->driverSnapShot(), delegate_->snapShot);
}

TEST_F(QVReportingDriverStatisticsTest, TakesTheSnapShotBeforeItAnswersAWaitingStart) {
  session()->stop();
  takeJournal();
  client_.start(7);
  runServerQueue();
  EXPECT_THAT(takeJournal(), ElementsAre(traceEntry(kTraceStart), traceEntry(kTraceSessionStarted),
                                         "snapshot taken", "reply 42 start 7: YES"));
}

TEST_F(QVReportingDriverStatisticsTest, SendsWhatGrewIntoTheSessionBeforeItStops) {
  delegate_->grown = {{"Speaker frames", 480}};
  stop();
  EXPECT_THAT(delegate_->asked, ElementsAre(delegate_->snapShot));
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(traceEntry(kTraceStop), traceEntry(kTraceMessageSent),
                  clientLine(standard, kStop, R"(fetching driver logs {"Speaker frames":480})"),
                  traceEntry(kTraceSessionStopped),
                  sessionLine(standard, "stop", "sending summary event for reporter 7"),
                  traceEntry(kTraceMessageSent), "reply 42 start 7: YES",
                  clientLine(standard, kStop, "stopping 7"), "reply 42 stop 7: YES"));
  EXPECT_THAT(
      takeBeaconStory(),
      ElementsAre(
          R"(message 1: 9/0 {"Speaker_frames":480})",
          R"(message 1: 65535/65535 {"QV_Session_Summary_Event":"65535","Speaker_frames":"480"})",
          "flush 1", "end 1"));
  EXPECT_THAT(session()->messageTypeCounts(),
              ElementsAre(std::pair("Tallying_Generic", 1), std::pair("Undefined_Unknown", 1)));
  EXPECT_EQ(session()->driverSnapShot(), nullptr);
  EXPECT_THAT(platform_.countwise().sentNames(), IsEmpty()) << "the sinks do not see it";
}

TEST_F(QVReportingDriverStatisticsTest, SendsNothingWhereNothingGrew) {
  stop();
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(traceEntry(kTraceStop),
                  clientLine(standard, kStop, "nothing interesting to fetch from the drivers"),
                  traceEntry(kTraceSessionStopped), "reply 42 start 7: YES",
                  clientLine(standard, kStop, "stopping 7"), "reply 42 stop 7: YES"));
  EXPECT_THAT(takeBeaconStory(), ElementsAre("flush 1", "end 1"));
}

TEST_F(QVReportingDriverStatisticsTest, SendsAnEmptyDictionaryToo) {
  delegate_->grown = QVDictionary(std::initializer_list<QVDictionaryEntry>{});
  stop();
  EXPECT_THAT(takeJournal(),
              ElementsAre(traceEntry(kTraceStop), traceEntry(kTraceMessageSent),
                          clientLine(standard, kStop, "fetching driver logs {}"),
                          traceEntry(kTraceSessionStopped),
                          sessionLine(standard, "stop", "sending summary event for reporter 7"),
                          traceEntry(kTraceMessageSent), "reply 42 start 7: YES",
                          clientLine(standard, kStop, "stopping 7"), "reply 42 stop 7: YES"));
}

TEST_F(QVReportingDriverStatisticsTest, SendsASingleMessageWhenTheSessionWasNotStarted) {
  stop();
  takeBeaconStory();
  delegate_->grown = {{"frames", 1}};
  stop();
  EXPECT_EQ(delegate_->asked.back(), nullptr) << "the snapshot is gone since the first stop";
  EXPECT_THAT(takeBeaconStory(), ElementsAre(R"(single: 9/0 {"frames":1})"));
}

}  // namespace
