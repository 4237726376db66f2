#include "QVServices/Statistics/Service/QVReportingServiceDelegate.h"
#include "QVServices/Statistics/Service/QVReportingServiceMain.h"
#include "tests/support/QVServiceFixture.h"
#include "tests/unit/core/QVLogDetour.h"

#include <atomic>
#include <chrono>
#include <fstream>
#include <optional>
#include <thread>

#include <unistd.h>

namespace {

using namespace std::chrono_literals;
using enum QVLogLevel;
using testing::ElementsAre;
using testing::IsEmpty;

std::string newConnectionLine(std::string_view connection) {
  return hostLine(standard,
                  "listener:shouldAcceptNewConnection:", QVText("newConnection: ", connection));
}
std::string newClientLine(int32_t pid) {
  return clientLine(standard, "initWithPID:delegate:", QVText("new client with pid ", pid));
}

class QVReportingServiceDelegateTest : public QVServiceFixture {};

// A connection that does something of the test's at each step of its being set up.
class ConnectionWithSetUp final : public QVIPCConnection {
 public:
  using SetUp = QVFunction<void(std::string_view step)>;

  explicit ConnectionWithSetUp(SetUp setUp) : setUp_(std::move(setUp)) {}

  int32_t processIdentifier() const override { return 44; }
  std::string description() const override { return "connection with set-up"; }
  void setExportedInterface(QVIPCInterface) override { setUp_("exported interface"); }
  void setExportedObject(std::shared_ptr<QVReportingServiceProtocol> object) override {
    exportedObject_ = std::move(object);
    setUp_("exported object");
  }
  std::shared_ptr<QVReportingServiceProtocol> exportedObject() const override {
    return exportedObject_;
  }
  void setInterruptionHandler(QVFunction<void()>) override { setUp_("interruption handler"); }
  void setInvalidationHandler(QVFunction<void()>) override { setUp_("invalidation handler"); }
  void resume() override { setUp_("resumed"); }

 private:
  SetUp setUp_;
  std::shared_ptr<QVReportingServiceProtocol> exportedObject_;
};

// A thread of its own that looks for a session, and whether it had to wait for who began it.
class LookUpOfAnotherThread {
 public:
  explicit LookUpOfAnotherThread(const QVReportingServiceDelegate& service) : service_(service) {}
  ~LookUpOfAnotherThread() {
    if (thread_.joinable()) thread_.join();
  }
  LookUpOfAnotherThread(const LookUpOfAnotherThread&) = delete;
  LookUpOfAnotherThread& operator=(const LookUpOfAnotherThread&) = delete;

  // Begins it, and returns when it has ended or is found to wait.
  void begin() {
    thread_ = std::thread([this] {
      threadIdentifier_ = ::gettid();
      service_.findReportingSessionForID(0);
      hasEnded_ = true;
    });
    while (threadIdentifier_ == 0) std::this_thread::yield();
    while (!hasEnded_ && !isAsleep()) std::this_thread::yield();
    hadEndedMeanwhile_ = hasEnded_;
  }
  // Before begin() returned. Asked once, after it.
  bool hadEndedMeanwhile() {
    thread_.join();
    return hadEndedMeanwhile_;
  }

 private:
  // Asks the kernel, which alone knows who waits for a lock. The state is the field behind the
  // thread's name, which stands in parentheses.
  bool isAsleep() const {
    std::ifstream file(QVText("/proc/self/task/", threadIdentifier_.load(), "/stat"));
    std::string line;
    std::getline(file, line);
    const auto name = line.rfind(") ");
    EXPECT_NE(name, std::string::npos) << "cannot tell: " << line;
    return name == std::string::npos || line[name + 2] == 'S';
  }

  const QVReportingServiceDelegate& service_;
  std::thread thread_;
  std::atomic<pid_t> threadIdentifier_ = 0;
  std::atomic<bool> hasEnded_ = false;
  bool hadEndedMeanwhile_ = false;
};

TEST_F(QVReportingServiceDelegateTest, RegistersTheServerScopeAndThenThatOfTheDrivers) {
  service();
  EXPECT_THAT(platform_.log().registrations(),
              ElementsAre(QVFakeLog::Registration{true, 0x71767273, "qvrs", "net.quillon.quietvox",
                                                  "reporting_server_verbose", 31},
                          QVFakeLog::Registration{true, 0x71767264, "qvrd", "net.quillon.quietvox",
                                                  "reporting_driver_verbose", 31}));
}

TEST_F(QVReportingServiceDelegateTest, MakesTheServerQueue) {
  service();
  const auto queues = platform_.queues().queues();
  ASSERT_EQ(queues.size(), 1u);
  EXPECT_EQ(queues[0].label, "net.quillon.quietvox.reporting.server");
  EXPECT_EQ(queues[0].quality, QVQualityOfService::userInteractive);
  EXPECT_EQ(queues[0].relativePriority, 0);
}

TEST_F(QVReportingServiceDelegateTest, StartsEnabledWithoutReadingPreferences) {
  platform_.preferences().setValue(kPreferencesDomain, "disable_reporting", true);
  platform_.preferences().setValue(kPreferencesDomain, "device_name", "Kitchen");
  EXPECT_TRUE(service().isReportingEnabled());
  EXPECT_TRUE(service().getDefaults().isAbsent());
  EXPECT_THAT(service().getAllClients(), IsEmpty());
  EXPECT_EQ(platform_.preferences().readingsOfDomain(kPreferencesDomain), 0u);
}

TEST_F(QVReportingServiceDelegateTest, ListensForDefaultsBeforeItSubscribesToTheDrivers) {
  platform_.tally().publish({"Speaker", std::nullopt}, {{"frames", 1}});
  startService();
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(hostLine(standard, "listenForDefaultsNotification", "notify setup result 0"),
                  driverLine(info, "init", "creating tallying driver utility"),
                  driverLine(standard, "init", "subscribed to group group Speaker-(null)")));
}

TEST_F(QVReportingServiceDelegateTest, HasAnEmptySnapShotAndNothingThatGrewWithoutDrivers) {
  ASSERT_NE(service().getSnapShot(), nullptr);
  EXPECT_THAT(service().getSnapShot()->sampleSets, IsEmpty());
  EXPECT_TRUE(service().getDriverStatisticsRelativeToSnapShot(service().getSnapShot()).isAbsent());
}

TEST_F(QVReportingServiceDelegateTest, ServesFromTheEntryPointUntilThePlatformEndsIt) {
  std::optional<bool> created;
  platform_.listener().onResume([&] {
    const auto connection = platform_.listener().connect(42);
    connection->call().createReportingSession(7, [&created](bool reply) { created = reply; });
    runUntilIdle();
  });
  EXPECT_EQ(QVReportingServiceMain(), 0);
  EXPECT_TRUE(platform_.listener().hasResumed());
  EXPECT_EQ(created, true);
}

TEST_F(QVReportingServiceDelegateTest, AcceptsAConnection) {
  QVTestClient& client = connectClient(42);
  EXPECT_TRUE(client.connection().isResumed());
  EXPECT_EQ(client.connection().exportedInterface(), QVIPCInterface::reportingService);
  ASSERT_NE(client.instance(), nullptr);
  EXPECT_EQ(client.instance()->processIdentifier(), 42);
  EXPECT_THAT(takeJournal(),
              ElementsAre(newConnectionLine("connection 1 of process 42"), newClientLine(42)));
}

TEST_F(QVReportingServiceDelegateTest, ResumesAConnectionThatIsWhollySetUp) {
  service();
  const auto connection = std::make_shared<ConnectionWithSetUp>([&](std::string_view step) {
    const auto waiting = platform_.queues().pendingCount(kServerQueue);
    journal_.note(QVText(step, waiting == 0 ? "" : ", registration waiting"));
  });
  EXPECT_TRUE(service().listener(platform_.listener(), connection));
  EXPECT_THAT(takeJournal(), ElementsAre(newConnectionLine("connection with set-up"),
                                         "exported interface", newClientLine(44), "exported object",
                                         "interruption handler, registration waiting",
                                         "invalidation handler, registration waiting",
                                         "resumed, registration waiting"));
}

TEST_F(QVReportingServiceDelegateTest, NamesTheSourceFileOfItsLines) {
  service();
  platform_.log().clear();
  connectClient(42);
  const auto lines = platform_.log().lines();
  ASSERT_FALSE(lines.empty());
  EXPECT_EQ(lines[0].file, "QVReportingServiceDelegate.cpp");
  EXPECT_GT(lines[0].line, 0u);
}

TEST_F(QVReportingServiceDelegateTest, AcceptsWhoeverComes) {
  for (const int32_t pid : {-1, 0, 1, INT32_MAX}) {
    EXPECT_FALSE(connectClient(pid).connection().isInvalidated()) << pid;
  }
  runUntilIdle();
  EXPECT_EQ(service().getAllClients().size(), 4u);
}

TEST_F(QVReportingServiceDelegateTest, AcceptsTwoProcessesAndListsThemInOrderOfRegistration) {
  QVTestClient& first = connectClient(42);
  QVTestClient& second = connectClient(43);
  EXPECT_TRUE(first.connection().isResumed());
  EXPECT_TRUE(second.connection().isResumed());
  EXPECT_THAT(takeJournal(),
              ElementsAre(newConnectionLine("connection 1 of process 42"), newClientLine(42),
                          newConnectionLine("connection 2 of process 43"), newClientLine(43)));
  EXPECT_THAT(service().getAllClients(), IsEmpty()) << "registered on the server queue only";
  runUntilIdle();
  EXPECT_THAT(service().getAllClients(), ElementsAre(first.instance(), second.instance()));
}

TEST_F(QVReportingServiceDelegateTest, ListsTwoConnectionsOfOneProcessApart) {
  const QVTestClient& first = connectClient(42);
  const QVTestClient& second = connectClient(42);
  runUntilIdle();
  EXPECT_THAT(service().getAllClients(), ElementsAre(first.instance(), second.instance()));
  EXPECT_NE(first.instance(), second.instance());
}

TEST_F(QVReportingServiceDelegateTest, LeavesTheClientToItsConnectionUntilRegistration) {
  QVTestClient& client = connectClient(42);
  const std::weak_ptr<QVReportingServerInstance> instance = client.instance();
  EXPECT_EQ(instance.use_count(), 1);
  client.connection().abandon();
  EXPECT_TRUE(instance.expired());
  runUntilIdle();
  EXPECT_THAT(service().getAllClients(), IsEmpty()) << "nobody is left to be registered";
}

TEST_F(QVReportingServiceDelegateTest, RegistersBeforeTheClientsFirstOperation) {
  QVTestClient& client = connectClient(42);
  client.listReporters();
  client.create(7);
  client.listReporters();
  runUntilIdle();
  EXPECT_THAT(replies(), ElementsAre("reply 42 reporters:", "reply 42 create 7: YES",
                                     "reply 42 reporters: 7"));
}

TEST_F(QVReportingServiceDelegateTest, RegistersOnTheServerQueueWithTheDateOfThatMoment) {
  const QVTestClient& client = connectClient(42);
  EXPECT_EQ(client.instance()->clientStartDate(), std::nullopt);
  platform_.clock().advance(3s);
  EXPECT_EQ(platform_.queues().pendingCount(kServerQueue), 1u);
  runServerQueue();
  EXPECT_EQ(client.instance()->clientStartDate(), QVFakeClock::kStart + 3s);
}

TEST_F(QVReportingServiceDelegateTest, AsksTheKernelForTheClientsName) {
  platform_.process().addProcess(42, "player");
  const QVTestClient& client = connectClient(42);
  EXPECT_EQ(client.instance()->clientProcessName(), std::nullopt);
  runUntilIdle();
  EXPECT_EQ(client.instance()->clientProcessName(), "player");
}

TEST_F(QVReportingServiceDelegateTest, NamesItsOwnProcessWithoutAskingTheKernel) {
  platform_.process().setOwnProcess(100, "quietvoxd");
  platform_.process().addProcess(100, "not this");
  const QVTestClient& client = connectClient(100);
  runUntilIdle();
  EXPECT_EQ(client.instance()->clientProcessName(), "quietvoxd");
  EXPECT_EQ(platform_.process().lookUpCount(), 0);
}

TEST_F(QVReportingServiceDelegateTest, DoesNotAskForTheNamesOfZeroAndNegativeProcesses) {
  platform_.process().addProcess(0, "kernel");
  platform_.process().addProcess(-1, "nobody");
  const QVTestClient& zero = connectClient(0);
  const QVTestClient& negative = connectClient(-1);
  runUntilIdle();
  EXPECT_EQ(zero.instance()->clientProcessName(), std::nullopt);
  EXPECT_EQ(negative.instance()->clientProcessName(), std::nullopt);
  EXPECT_EQ(platform_.process().lookUpCount(), 0);
}

TEST_F(QVReportingServiceDelegateTest, LeavesAnUnknownProcessWithoutAName) {
  const QVTestClient& client = connectClient(42);
  runUntilIdle();
  EXPECT_EQ(client.instance()->clientProcessName(), std::nullopt);
  EXPECT_EQ(platform_.process().lookUpCount(), 1);
  EXPECT_THAT(service().getAllClients(), ElementsAre(client.instance()));
}

TEST_F(QVReportingServiceDelegateTest, FindsTheFirstClientsSession) {
  QVTestClient& first = clientWithSession(42, 7);
  clientWithSession(43, 7);
  EXPECT_EQ(service().findReportingSessionForID(7), first.session(7));
  EXPECT_THAT(takeJournal(), ElementsAre(lookupHit(7, 42)));
}

TEST_F(QVReportingServiceDelegateTest, FindsALaterClientsSession) {
  clientWithSession(42, 7);
  QVTestClient& second = clientWithSession(43, -9);
  EXPECT_EQ(service().findReportingSessionForID(-9), second.session(-9));
  EXPECT_THAT(takeJournal(), ElementsAre(lookupHit(-9, 43)));
}

TEST_F(QVReportingServiceDelegateTest, ComplainsAboutASessionThatNobodyHas) {
  clientWithSession(42, 7);
  EXPECT_EQ(service().findReportingSessionForID(INT64_MIN), nullptr);
  EXPECT_THAT(takeJournal(), ElementsAre(lookupFailure(INT64_MIN)));
}

TEST_F(QVReportingServiceDelegateTest, NeverFindsSessionZero) {
  QVTestClient& client = connectClient(42);
  client.create(0);
  runUntilIdle();
  takeJournal();
  EXPECT_NE(client.session(0), nullptr);
  EXPECT_EQ(service().findReportingSessionForID(0), nullptr);
  EXPECT_THAT(takeJournal(), IsEmpty());
}

TEST_F(QVReportingServiceDelegateTest, FindsNothingWhileReportingIsSwitchedOff) {
  QVTestClient& client = clientWithSession(42, 7);
  switchReporting(false);
  EXPECT_EQ(service().findReportingSessionForID(7), nullptr);
  EXPECT_EQ(service().findReportingSessionForID(8), nullptr);
  EXPECT_THAT(takeJournal(), IsEmpty());
  switchReporting(true);
  EXPECT_EQ(service().findReportingSessionForID(7), client.session(7));
}

TEST_F(QVReportingServiceDelegateTest, FindsASessionWhileItSetsUpAConnection) {
  QVTestClient& client = clientWithSession(42, 7);
  std::shared_ptr<QVReportingSession> found;
  const auto connection = std::make_shared<ConnectionWithSetUp>(
      [&](std::string_view) { found = service().findReportingSessionForID(7); });
  EXPECT_TRUE(service().listener(platform_.listener(), connection));
  EXPECT_EQ(found, client.session(7));
}

TEST_F(QVReportingServiceDelegateTest, FindsASessionWhileItLooksForAnother) {
  QVTestClient& client = clientWithSession(42, 7);
  std::shared_ptr<QVReportingSession> found;
  QVLogDetour::install([&](std::string_view text) {
    if (text == "failed to find reporting session 99") {
      found = service().findReportingSessionForID(7);
    }
  });
  EXPECT_EQ(service().findReportingSessionForID(99), nullptr);
  EXPECT_EQ(found, client.session(7));
  EXPECT_THAT(takeJournal(), ElementsAre(lookupHit(7, 42), lookupFailure(99)));
}

TEST_F(QVReportingServiceDelegateTest, KeepsOtherThreadsWaitingWhileItSetsUpAConnection) {
  for (const std::string_view locked : {"exported interface", "exported object"}) {
    LookUpOfAnotherThread lookUp(service());
    const auto connection = std::make_shared<ConnectionWithSetUp>([&](std::string_view step) {
      if (step == locked) lookUp.begin();
    });
    EXPECT_TRUE(service().listener(platform_.listener(), connection));
    EXPECT_FALSE(lookUp.hadEndedMeanwhile()) << locked;
  }
}

TEST_F(QVReportingServiceDelegateTest, KeepsOtherThreadsWaitingWhileItLooksForASession) {
  LookUpOfAnotherThread lookUp(service());
  QVLogDetour::install([&](std::string_view) { lookUp.begin(); });
  EXPECT_EQ(service().findReportingSessionForID(99), nullptr);
  EXPECT_FALSE(lookUp.hadEndedMeanwhile());
}

TEST_F(QVReportingServiceDelegateTest, RemovesAClientFromTheListAndTakesNoteOfNoOther) {
  const QVTestClient& first = connectClient(42);
  const QVTestClient& second = connectClient(43);
  runUntilIdle();
  const auto removed = first.instance();
  service().removeClient(*removed);
  EXPECT_THAT(service().getAllClients(), ElementsAre(second.instance()));
  service().removeClient(*removed);
  EXPECT_THAT(service().getAllClients(), ElementsAre(second.instance()));
}

}  // namespace
