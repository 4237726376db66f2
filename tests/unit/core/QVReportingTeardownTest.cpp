// What of a session's end, and of a client's, still happens where one of its steps throws.

#include "QVServices/Statistics/Service/QVReportingSession.h"
#include "tests/support/QVServiceFixture.h"
#include "tests/unit/core/QVLogDetour.h"

#include <memory>
#include <new>
#include <stdexcept>
#include <utility>

namespace {

using enum QVLogLevel;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

constexpr uint16_t kTelephony = 2;
constexpr std::string_view kStop = "stopReportingSessionForID:reply:";
constexpr std::string_view kDestroy = "destroyReportingSession:reply:";

class ThrowingFileSystem final : public QVFileSystem {
 public:
  std::string diagnosticLogRoot() const override { return "/logs"; }
  std::optional<QVError> createDirectory(const std::string&, uint32_t) override {
    throw std::bad_alloc();
  }
  std::unique_ptr<QVAtomicFile> makeAtomicFile(const std::string&) override {
    throw std::bad_alloc();
  }
};

class ThrowingJSONOutput final : public QVJSONOutput {
 public:
  std::unique_ptr<QVJSONArrayStream> makeArrayStream(Sink) override {
    return std::make_unique<Stream>();
  }

 private:
  class Stream final : public QVJSONArrayStream {
    std::optional<QVError> append(std::span<const QVDictionaryEntry>) override {
      throw std::bad_alloc();
    }
    std::optional<QVError> append(std::string_view, std::span<const QVDictionaryEntry>) override {
      throw std::bad_alloc();
    }
    void end() override {}
  };
};

// Keeps the one in whose place it is put, which its platform knows by address.
class ThrowingOrientation final : public QVOrientation {
 public:
  explicit ThrowingOrientation(std::unique_ptr<QVOrientation> orientation)
      : orientation_(std::move(orientation)) {}
  void QVRegisterDeviceOrientation(std::string_view, Callback) override {}
  void QVRegisterUIOrientation(std::string_view, Callback) override {}
  void QVUnregisterDeviceOrientation(std::string_view) override {
    throw std::runtime_error("gone");
  }
  void QVUnregisterUIOrientation(std::string_view) override { throw std::runtime_error("gone"); }

 private:
  const std::unique_ptr<QVOrientation> orientation_;
};

class QVReportingTeardownTest : public QVServiceFixture {
 protected:
  QVReportingTeardownTest() { makeInternalBuild(); }

  static void failFiles() {
    QVPlatform::shared().fileSystem = std::make_unique<ThrowingFileSystem>();
  }
  // A client whose session 7 has sent a message.
  QVTestClient& clientThatSent(uint16_t serviceType = 1) {
    QVTestClient& client = clientWithStartedSession(42, 7, serviceType);
    client.send({{"a", 1}}, {7});
    runUntilIdle();
    journal_.forget();
    takeBeaconStory();
    return client;
  }
  static void expectStopped(const QVReportingSession& session) {
    EXPECT_FALSE(session.started());
    EXPECT_EQ(session.aggregatedPayloadData(), nullptr);
    EXPECT_EQ(session.nestedAggregatedPayloadData(), nullptr);
  }
  std::vector<std::string> errors() { return journal_.entries("3["); }
};

// ---- steps of a session's stop

TEST_F(QVReportingTeardownTest, StopsASessionWhoseFileSystemThrows) {
  QVTestClient& client = clientThatSent();
  failFiles();
  client.stop(7);
  runServerQueue();
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(traceEntry(kTraceStop),
                  clientLine(standard, kStop, "nothing interesting to fetch from the drivers"),
                  traceEntry(kTraceSessionStopped),
                  sessionLine(standard, "stop", "sending summary event for reporter 7"),
                  traceEntry(kTraceMessageSent),
                  sessionLine(error, "stop",
                              "failed to write the summary file of reporter 7: std::bad_alloc"),
                  "reply 42 start 7: YES", clientLine(standard, kStop, "stopping 7"),
                  "reply 42 stop 7: YES"));
  expectStopped(*client.session(7));
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(),
              ElementsAre(R"(message 1: 65535/65535 {"QV_Session_Summary_Event":"1","a":"1"})",
                          "flush 1", "end 1"));
}

TEST_F(QVReportingTeardownTest, StopsASessionWhoseFileCannotBeMadeUp) {
  QVTestClient& client = clientThatSent();
  QVPlatform::shared().jsonOutput = std::make_unique<ThrowingJSONOutput>();
  client.stop(7);
  runUntilIdle();
  EXPECT_THAT(errors(), ElementsAre(sessionLine(
                            error, "stop",
                            "failed to write the summary file of reporter 7: std::bad_alloc")));
  EXPECT_THAT(replies(), ElementsAre("reply 42 start 7: YES", "reply 42 stop 7: YES"));
  expectStopped(*client.session(7));
  EXPECT_EQ(takeBeaconStory().back(), "end 1");
  EXPECT_EQ(platform_.fileSystem().openFiles(), 0u);
  EXPECT_THAT(platform_.fileSystem().files(), IsEmpty());
}

TEST_F(QVReportingTeardownTest, StopsASessionThatCannotBeSummedUp) {
  QVTestClient& client = clientThatSent();
  QVLogDetour::failLines({"sending summary event for reporter 7"});
  client.stop(7);
  runUntilIdle();
  EXPECT_THAT(errors(), ElementsAre(sessionLine(
                            error, "stop",
                            "failed to send the summary event of reporter 7: std::bad_alloc")));
  EXPECT_THAT(replies(), ElementsAre("reply 42 start 7: YES", "reply 42 stop 7: YES"));
  expectStopped(*client.session(7));
  EXPECT_THAT(takeBeaconStory(), ElementsAre("flush 1", "end 1"));
  EXPECT_THAT(platform_.fileSystem().files(), SizeIs(1)) << "the file is written all the same";
}

TEST_F(QVReportingTeardownTest, StopsASessionWithoutMemoryForTheErrorLineEither) {
  QVTestClient& client = clientThatSent();
  failFiles();
  QVLogDetour::failLines({"failed to write the summary file of reporter 7: std::bad_alloc"});
  client.stop(7);
  runUntilIdle();
  EXPECT_THAT(errors(), IsEmpty());
  EXPECT_THAT(replies(), ElementsAre("reply 42 start 7: YES", "reply 42 stop 7: YES"));
  expectStopped(*client.session(7));
  EXPECT_THAT(takeBeaconStory(), SizeIs(3));
}

TEST_F(QVReportingTeardownTest, StopsASessionWhoseOrientationCannotBeUnregistered) {
  auto& orientation = QVPlatform::shared().orientation;
  orientation = std::make_unique<ThrowingOrientation>(std::move(orientation));
  QVTestClient& client = clientThatSent(kTelephony);
  client.stop(7);
  runUntilIdle();
  EXPECT_THAT(errors(),
              ElementsAre(sessionLine(error, "stop",
                                      "failed to unregister the device callback of reporter 7: "
                                      "gone"),
                          sessionLine(error, "stop",
                                      "failed to unregister the UI callback of reporter 7: gone")));
  expectStopped(*client.session(7));
  EXPECT_EQ(client.session(7)->orientationCallbackID(), std::nullopt);
  EXPECT_EQ(takeBeaconStory().back(), "end 1");
}

TEST_F(QVReportingTeardownTest, StartsAgainAfterAStopThatFailed) {
  QVTestClient& client = clientThatSent();
  failFiles();
  client.stop(7);
  client.start(7);
  runUntilIdle();
  EXPECT_TRUE(client.session(7)->started());
  EXPECT_TRUE(client.session(7)->aggregatedPayloadData()->empty());
}

TEST_F(QVReportingTeardownTest, StopsASessionThatCannotSayThatItEnds) {
  makeSessionsVerbose();
  QVTestClient& client = clientThatSent();
  QVLogDetour::failLines({"ending session 7"});
  client.stop(7);
  runUntilIdle();
  const auto line =
      sessionLine(error, "stop", "failed to log the end of reporter 7: std::bad_alloc");
  EXPECT_THAT(errors(), ElementsAre(line, line));
  EXPECT_THAT(replies(), ElementsAre("reply 42 start 7: YES", "reply 42 stop 7: YES"));
  expectStopped(*client.session(7));
  EXPECT_THAT(takeBeaconStory(), SizeIs(3));
}

TEST_F(QVReportingTeardownTest, LetsASessionGoThatCannotSayThatItGoes) {
  QVTestClient& client = clientThatSent();
  QVLogDetour::failLines({"deallocing this session 7"});
  client.destroy(7);
  runUntilIdle();
  EXPECT_THAT(errors(),
              ElementsAre(sessionLine(error, "dealloc",
                                      "failed to log the end of reporter 7: std::bad_alloc")));
}

// ---- the operations around it

TEST_F(QVReportingTeardownTest, AnswersAStopThatCannotBeLogged) {
  QVTestClient& client = clientThatSent();
  QVLogDetour::failLines({"stopping 7"});
  client.stop(7);
  runUntilIdle();
  EXPECT_THAT(errors(), ElementsAre(clientLine(
                            error, kStop, "failed to log the stop of reporter 7: std::bad_alloc")));
  EXPECT_THAT(replies(), ElementsAre("reply 42 start 7: YES", "reply 42 stop 7: YES"));
}

TEST_F(QVReportingTeardownTest, StopsASessionWhoseDriverStatisticsFail) {
  QVTestClient& client = clientThatSent();
  QVLogDetour::failLines({"nothing interesting to fetch from the drivers"});
  client.stop(7);
  runUntilIdle();
  EXPECT_THAT(errors(),
              ElementsAre(clientLine(
                  error, kStop, "failed to send driver statistics of reporter 7: std::bad_alloc")));
  EXPECT_THAT(replies(), ElementsAre("reply 42 start 7: YES", "reply 42 stop 7: YES"));
  EXPECT_EQ(client.session(7)->driverSnapShot(), nullptr);
  expectStopped(*client.session(7));
}

TEST_F(QVReportingTeardownTest, ForgetsADestroyedSessionWhoseStopFails) {
  QVTestClient& client = clientThatSent();
  failFiles();
  QVLogDetour::failLines({"destroying 7"});
  client.destroy(7);
  runUntilIdle();
  EXPECT_THAT(errors(),
              ElementsAre(sessionLine(error, "stop",
                                      "failed to write the summary file of reporter 7: "
                                      "std::bad_alloc"),
                          clientLine(error, kDestroy,
                                     "failed to log the end of reporter 7: std::bad_alloc")));
  EXPECT_THAT(replies(), ElementsAre("reply 42 destroy 7: YES"));
  EXPECT_EQ(client.session(7), nullptr);
}

TEST_F(QVReportingTeardownTest, RemovesAClientWhoseSessionsFailToStop) {
  QVTestClient& client = clientThatSent();
  client.create(8);
  client.start(8);
  client.send({{"a", 1}}, {8});
  runUntilIdle();
  const auto first = client.session(7);
  const auto second = client.session(8);
  takeBeaconStory();
  journal_.forget();
  failFiles();
  client.disconnect();
  runUntilIdle();
  EXPECT_THAT(errors(), SizeIs(2)) << "a line for each";
  expectStopped(*first);
  expectStopped(*second);
  EXPECT_THAT(service().getAllClients(), IsEmpty());
}

}  // namespace
