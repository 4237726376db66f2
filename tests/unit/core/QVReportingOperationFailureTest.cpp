// What a client's calls still do, and that they are answered, where one of their steps throws.

#include "tests/support/QVServiceFixture.h"
#include "tests/unit/core/QVLogDetour.h"

#include <new>
#include <stdexcept>

namespace {

using enum QVLogLevel;
using testing::ElementsAre;
using testing::IsEmpty;

class ThrowingCountwise final : public QVCountwise {
 public:
  void sendEventLazily(std::string, PayloadCallback) override { throw std::runtime_error("gone"); }
};

std::string routingError(std::string_view text) {
  return clientLine(error, "sendMessage:withCategory:andType:forReportingIDs:reply:", text);
}

class QVReportingOperationFailureTest : public QVServiceFixture {
 protected:
  std::vector<std::string> errors() { return journal_.entries("3["); }

  const QVDictionary haptics_{{"EngineOnTime", 12.5}, {"qvreporting_timestamp", 1000}};
};

TEST_F(QVReportingOperationFailureTest, AnswersACreationThatFails) {
  QVTestClient& client = clientWithSession(42, 7);
  QVLogDetour::failLines({"created reporting session for ID: 8"});
  client.create(8);
  runServerQueue();
  EXPECT_THAT(errors(), ElementsAre(clientLine(error, "createReportingSession:reply:",
                                               "failed to create the session of reporter 8: "
                                               "std::bad_alloc")));
  EXPECT_THAT(replies(), ElementsAre("reply 42 create 8: YES"));
  EXPECT_EQ(client.session(8), nullptr);
}

TEST_F(QVReportingOperationFailureTest, AnswersASetServiceTypeThatFails) {
  QVTestClient& client = clientWithSession(42, 7);
  QVLogDetour::failLines({"service type 2 set for reporter  7"});
  client.setServiceType(2, 7);
  runServerQueue();
  EXPECT_THAT(errors(), ElementsAre(clientLine(error, "setServiceType:reportingSession:reply:",
                                               "failed to set the service type of reporter 7: "
                                               "std::bad_alloc")));
  EXPECT_THAT(replies(), ElementsAre("reply 42 setServiceType 7: YES"));
}

TEST_F(QVReportingOperationFailureTest, AnswersAConfigurationThatFails) {
  QVTestClient& client = clientWithSession(42, 7);
  QVLogDetour::failLines({"user information of 7 would be larger than 65536 bytes, nothing added"});
  client.setConfiguration({{"text", std::string(70'000, 'x')}}, 7);
  runServerQueue();
  EXPECT_THAT(errors(), ElementsAre(clientLine(error, "setConfiguration:forReporterID:reply:",
                                               "failed to configure the session of reporter 7: "
                                               "std::bad_alloc")));
  EXPECT_THAT(replies(), ElementsAre("reply 42 setConfiguration 7: YES"));
}

TEST_F(QVReportingOperationFailureTest, KeepsTheReplyOfAStartThatFailsForTheStop) {
  makeSessionsVerbose();
  QVTestClient& client = clientWithSession(42, 7);
  QVLogDetour::failLines({"starting session owned by 7"});
  client.start(7);
  runServerQueue();
  EXPECT_THAT(errors(),
              ElementsAre(clientLine(error, "startReportingSessionForID:reply:",
                                     "failed to start the session of reporter 7: std::bad_alloc")));
  EXPECT_THAT(replies(), IsEmpty());
  client.stop(7);
  runServerQueue();
  EXPECT_THAT(replies(), ElementsAre("reply 42 start 7: YES", "reply 42 stop 7: YES"));
}

TEST_F(QVReportingOperationFailureTest, AnswersAValidationThatCannotBeLogged) {
  QVTestClient& client = clientWithSession(42, 7);
  QVLogDetour::failLines({"validating reporter 7"});
  client.validate(7);
  runServerQueue();
  EXPECT_THAT(errors(), ElementsAre(clientLine(error, "reporterID:valid:",
                                               "failed to log the validation of reporter 7: "
                                               "std::bad_alloc")));
  EXPECT_THAT(replies(), ElementsAre(R"(reply 42 validate 7: {"reporterID":7,"serviceType":1})"));
}

TEST_F(QVReportingOperationFailureTest, AnswersWhereTheLookUpFails) {
  QVTestClient& client = clientWithSession(42, 7);
  QVLogDetour::failLines({"failed to find reporting session 99"});
  client.getServiceType(99);
  client.validate(99);
  client.start(99);
  runServerQueue();
  const auto failure = [](std::string_view operation) {
    return clientLine(error, operation,
                      "failed to find the session of reporter 99: std::bad_alloc");
  };
  EXPECT_THAT(errors(), ElementsAre(failure("getServiceNameForReporterID:reply:"),
                                    failure("reporterID:valid:"),
                                    failure("startReportingSessionForID:reply:")));
  EXPECT_THAT(replies(),
              ElementsAre("reply 42 getServiceType 99: 65535",
                          R"(reply 42 validate 99: {"reporterID":0,"serviceType":65535})",
                          "reply 42 start 99: YES"));
}

TEST_F(QVReportingOperationFailureTest, ReachesEverySessionWhereASinkFails) {
  QVTestClient& client = clientWithStartedSession(42, 7);
  client.create(8);
  client.start(8);
  runUntilIdle();
  journal_.forget();
  takeBeaconStory();
  QVPlatform::shared().countwise = std::make_unique<ThrowingCountwise>();
  client.send(haptics_, {7, 8});
  runServerQueue();
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(traceEntry(kTraceRouted),
                  routingError("failed to make an analytics event for reporter 7: gone"),
                  "joulewell Vidra_Haptics", traceEntry(kTraceMessageSent),
                  routingError("failed to make an analytics event for reporter 8: gone"),
                  "joulewell Vidra_Haptics", traceEntry(kTraceMessageSent), "reply 42 send: nil"));
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(), testing::SizeIs(2));
}

TEST_F(QVReportingOperationFailureTest, ReachesTheOthersWhereOneSessionFails) {
  makeSessionsVerbose();
  QVTestClient& client = clientWithStartedSession(42, 7);
  client.create(8);
  client.start(8);
  runUntilIdle();
  journal_.forget();
  takeBeaconStory();
  QVLogDetour::failLines({"sending message for session owned by 7"});
  client.send({{"a", 1}}, {7, 8});
  client.sendToAll({{"a", 2}});
  runUntilIdle();
  const std::string line = routingError("failed to send a message of reporter 7: std::bad_alloc");
  EXPECT_THAT(errors(), ElementsAre(line, line));
  EXPECT_THAT(replies(), ElementsAre("reply 42 send: nil", "reply 42 send: nil"));
  EXPECT_THAT(takeBeaconStory(),
              ElementsAre(R"(message 2: 3/1 {"a":1})", R"(message 2: 3/1 {"a":2})"));
}

TEST_F(QVReportingOperationFailureTest, ReachesTheOthersWhereOneIsNotFound) {
  QVTestClient& client = clientWithStartedSession(42, 7);
  takeBeaconStory();
  QVLogDetour::failLines({"failed to find reporting session 99"});
  client.send({{"a", 1}}, {99, 7});
  runUntilIdle();
  EXPECT_THAT(errors(), ElementsAre(routingError("failed to find the session of reporter 99: "
                                                 "std::bad_alloc")));
  EXPECT_THAT(replies(), ElementsAre("reply 42 send: nil"));
  EXPECT_THAT(takeBeaconStory(), ElementsAre(R"(message 1: 3/1 {"a":1})"));
}

TEST_F(QVReportingOperationFailureTest, ReachesAllWhereTheirListCannotBeLogged) {
  QVTestClient& client = clientWithStartedSession(42, 7);
  takeBeaconStory();
  const std::string sessions = QVText("[", client.session(7)->description(), "]");
  QVLogDetour::failLines(
      {"sessions for client 42 : " + sessions, "active reporting sessions 1 : " + sessions});
  client.sendToAll({{"a", 1}});
  runUntilIdle();
  EXPECT_THAT(
      errors(),
      ElementsAre(routingError("failed to log the sessions of client 42: std::bad_alloc"),
                  routingError("failed to log the active sessions for client 42: std::bad_alloc")));
  EXPECT_THAT(replies(), ElementsAre("reply 42 send: nil"));
  EXPECT_THAT(takeBeaconStory(), ElementsAre(R"(message 1: 3/1 {"a":1})"));
}

}  // namespace
