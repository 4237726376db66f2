// What each operation says on the wire, and what becomes of the answers.

#include "platform/QVValue.h"
#include "platform/linux/bus/QVBusValueDecoder.h"
#include "tests/unit/client/QVScriptedService.h"

#include <optional>

#include <gtest/gtest.h>

namespace {

using Call = QVScriptedService::Call;
using Code = QVClientError::Code;

class QVClientCallsTest : public testing::Test {
 protected:
  // The one call that the client has sent.
  Call sentCall() {
    auto calls = service_.callsSoFar();
    EXPECT_EQ(calls.size(), 1U);
    if (calls.empty()) return {};
    EXPECT_EQ(calls[0].path, "/net/quillon/quietvox/ReportingService");
    EXPECT_EQ(calls[0].interface, "net.quillon.quietvox.ReportingService");
    return calls[0];
  }

  // A reply that keeps its outcome.
  template <class Value>
  static std::function<void(const QVClientResult<Value>&)> keepIn(
      std::optional<QVClientResult<Value>>& outcome) {
    return [&outcome](const QVClientResult<Value>& result) {
      EXPECT_FALSE(outcome) << "a second reply";
      outcome = result;
    };
  }

  // An operation that takes a reporter ID and answers that it was handled.
  void expectReporterCall(const std::string& member,
                          QVClientError (QVClient::*operation)(int64_t, QVClientBooleanReply)) {
    std::optional<QVClientResult<bool>> handled;
    EXPECT_FALSE((client_.get()->*operation)(-77, keepIn(handled)));
    const Call call = sentCall();
    EXPECT_EQ(call.member, member);
    EXPECT_EQ(call.signature, "x");
    EXPECT_TRUE(call.answerWanted);
    QVBusReader reader = call.reader();
    EXPECT_EQ(reader.readNumber<int64_t>(), -77);
    EXPECT_TRUE(reader.atEnd());
    service_.answerBoolean(call);
    client_->dispatch();
    ASSERT_TRUE(handled);
    EXPECT_TRUE(*handled);
    EXPECT_TRUE(handled->value());
  }

  QVScriptedService service_;
  std::unique_ptr<QVClient> client_ = service_.connectLoopClient();
};

TEST_F(QVClientCallsTest, CreateReportingSession) {
  expectReporterCall("CreateReportingSession", &QVClient::createReportingSession);
}

TEST_F(QVClientCallsTest, StartReportingSessionForID) {
  expectReporterCall("StartReportingSessionForID", &QVClient::startReportingSessionForID);
}

TEST_F(QVClientCallsTest, StopReportingSessionForID) {
  expectReporterCall("StopReportingSessionForID", &QVClient::stopReportingSessionForID);
}

TEST_F(QVClientCallsTest, DestroyReportingSession) {
  expectReporterCall("DestroyReportingSession", &QVClient::destroyReportingSession);
}

TEST_F(QVClientCallsTest, SetServiceType) {
  std::optional<QVClientResult<bool>> handled;
  EXPECT_FALSE(client_->setServiceType(QVClientServiceType::longformaudio, 12, keepIn(handled)));
  const Call call = sentCall();
  EXPECT_EQ(call.member, "SetServiceType");
  EXPECT_EQ(call.signature, "qx");
  QVBusReader reader = call.reader();
  EXPECT_EQ(reader.readNumber<uint16_t>(), 7);
  EXPECT_EQ(reader.readNumber<int64_t>(), 12);
  EXPECT_TRUE(reader.atEnd());
  service_.answerBoolean(call);
  client_->dispatch();
  EXPECT_TRUE(handled->value());
}

TEST_F(QVClientCallsTest, GetServiceNameForReporterID) {
  std::optional<QVClientResult<QVClientServiceType>> serviceType;
  EXPECT_FALSE(client_->getServiceNameForReporterID(5, keepIn(serviceType)));
  const Call call = sentCall();
  EXPECT_EQ(call.member, "GetServiceNameForReporterID");
  EXPECT_EQ(call.signature, "x");
  service_.answer(call, "q", [](QVBusWriter& writer) { writer.writeNumber<uint16_t>(8); });
  client_->dispatch();
  EXPECT_EQ(serviceType->value(), QVClientServiceType::nonlongformaudio);
}

TEST_F(QVClientCallsTest, SetConfigurationAtEveryLengthOfTheDictionary) {
  for (std::size_t length = 0; length < 9; ++length) {
    const std::string text(length, 't');
    QVClientPayload configuration;
    configuration.set("text", text);
    std::optional<QVClientResult<bool>> handled;
    EXPECT_FALSE(client_->setConfiguration(configuration, 33, keepIn(handled)));
    const Call call = sentCall();
    EXPECT_EQ(call.member, "SetConfiguration");
    EXPECT_EQ(call.signature, "a{sv}x");
    QVBusReader reader = call.reader();
    EXPECT_EQ(QVBusValueDecoder().readDictionary(reader, nullptr), (QVDictionary{{"text", text}}));
    EXPECT_EQ(reader.readNumber<int64_t>(), 33);
    EXPECT_TRUE(reader.atEnd());
    service_.answerBoolean(call);
    client_->dispatch();
    EXPECT_TRUE(handled->value());
  }
}

// Reads the arguments of a SendMessage.
struct SentMessage {
  QVDictionary message;
  uint32_t category = 0;
  uint16_t type = 0;
  bool everySession = false;
  std::vector<int64_t> reporterIDs;

  explicit SentMessage(const Call& call) {
    EXPECT_EQ(call.member, "SendMessage");
    EXPECT_EQ(call.signature, "a{sv}uqbax");
    QVBusReader reader = call.reader();
    message = QVBusValueDecoder().readDictionary(reader, nullptr);
    category = reader.readNumber<uint32_t>();
    type = reader.readNumber<uint16_t>();
    everySession = reader.readBoolean();
    const std::size_t end = reader.enterArray(8);
    while (reader.position() < end) reporterIDs.push_back(reader.readNumber<int64_t>());
    reader.leaveArray(end);
    EXPECT_TRUE(reader.ok());
    EXPECT_TRUE(reader.atEnd());
  }
};

constexpr QVClientCategory kSessionPlayback{QVClientComponent::session, QVClientKind::playback};

TEST_F(QVClientCallsTest, SendMessageToOneSessionAtEveryLengthOfTheMessage) {
  for (std::size_t length = 0; length < 9; ++length) {
    const std::string text(length, 't');
    QVClientPayload message;
    message.set("frames", 480).set("text", text);
    std::optional<QVClientError> outcome;
    EXPECT_FALSE(client_->sendMessage(message, kSessionPlayback, QVClientMessageType::start, -9,
                                      [&](const QVClientError& error) { outcome = error; }));
    const Call call = sentCall();
    const SentMessage sent(call);
    EXPECT_EQ(sent.message, (QVDictionary{{"frames", 480}, {"text", text}}));
    EXPECT_EQ(sent.category, 0x08000003U);
    EXPECT_EQ(sent.type, 1);
    EXPECT_FALSE(sent.everySession);
    EXPECT_EQ(sent.reporterIDs, std::vector<int64_t>{-9});
    service_.answer(call);
    client_->dispatch();
    ASSERT_TRUE(outcome);
    EXPECT_FALSE(*outcome);
  }
}

TEST_F(QVClientCallsTest, SendMessageToSeveralSessionsToNoneAndToAll) {
  const QVClientPayload message;
  const std::vector<int64_t> reporterIDs{1, 0, -1, INT64_MAX};
  const auto ignore = [](const QVClientError&) {};
  const auto sent = [&](const QVClientTargets& targets) {
    EXPECT_FALSE(client_->sendMessage(message, QVClientCategory(0xFFFFFFFFU),
                                      QVClientMessageType::unknown, targets, ignore));
    return SentMessage(sentCall());
  };
  const SentMessage several = sent(std::span(reporterIDs));
  EXPECT_EQ(several.reporterIDs, reporterIDs);
  EXPECT_FALSE(several.everySession);
  EXPECT_EQ(several.category, 0xFFFFFFFFU);
  EXPECT_EQ(several.type, 0xFFFF);
  const SentMessage none = sent(std::span<const int64_t>());
  EXPECT_TRUE(none.reporterIDs.empty());
  EXPECT_FALSE(none.everySession);
  const SentMessage all = sent(QVClientTargets::everySession());
  EXPECT_TRUE(all.reporterIDs.empty());
  EXPECT_TRUE(all.everySession);
}

TEST_F(QVClientCallsTest, ReporterIDValid) {
  std::optional<QVClientResult<QVClientReporter>> reporter;
  EXPECT_FALSE(client_->reporterIDValid(44, keepIn(reporter)));
  const Call call = sentCall();
  EXPECT_EQ(call.member, "ReporterIDValid");
  EXPECT_EQ(call.signature, "x");
  service_.answer(call, "a{sv}", [](QVBusWriter& writer) {
    const auto array = writer.beginArray(8);
    writer.beginStruct();
    writer.writeString("added later");
    writer.writeVariant(QVDictionary{{"list", QVArray{1, "2"}}});
    writer.beginStruct();
    writer.writeString("reporterID");
    writer.beginVariant("x");
    writer.writeNumber<int64_t>(44);
    writer.beginStruct();
    writer.writeString("serviceType");
    writer.beginVariant("q");
    writer.writeNumber<uint16_t>(2);
    writer.endArray(array);
  });
  client_->dispatch();
  ASSERT_TRUE(*reporter) << reporter->error().text();
  EXPECT_EQ(reporter->value().reporterID, 44);
  EXPECT_EQ(reporter->value().serviceType, QVClientServiceType::telephony);
}

TEST_F(QVClientCallsTest, GetAllReporters) {
  for (const std::vector<int64_t>& list : {std::vector<int64_t>{}, {3}, {-1, 0, INT64_MIN}}) {
    std::optional<QVClientResult<std::vector<int64_t>>> reporters;
    EXPECT_FALSE(client_->getAllReporters(keepIn(reporters)));
    const Call call = sentCall();
    EXPECT_EQ(call.member, "GetAllReporters");
    EXPECT_EQ(call.signature, "");
    EXPECT_TRUE(call.body.empty());
    service_.answer(call, "ax", [&list](QVBusWriter& writer) {
      const auto array = writer.beginArray(8);
      for (const int64_t reporterID : list) writer.writeNumber(reporterID);
      writer.endArray(array);
    });
    client_->dispatch();
    EXPECT_EQ(reporters->value(), list);
  }
}

TEST_F(QVClientCallsTest, KillServiceSucceedsByTheLossOfTheConnection) {
  std::optional<QVClientResult<bool>> killed;
  EXPECT_FALSE(client_->killService(keepIn(killed)));
  const Call call = sentCall();
  EXPECT_EQ(call.member, "KillService");
  EXPECT_EQ(call.signature, "");
  service_.hangUp();
  dispatchWhenReadable(*client_);
  ASSERT_TRUE(killed);
  EXPECT_TRUE(*killed) << killed->error().text();
  EXPECT_TRUE(killed->value());
}

TEST_F(QVClientCallsTest, KillServiceFailsWhereTheServiceRefuses) {
  std::optional<QVClientResult<bool>> killed;
  EXPECT_FALSE(client_->killService(keepIn(killed)));
  service_.refuse(sentCall(), "org.freedesktop.DBus.Error.AccessDenied", "not by you");
  client_->dispatch();
  EXPECT_EQ(killed->error().code(), Code::refused);
}

TEST_F(QVClientCallsTest, WithoutAReplyNoAnswerIsAskedFor) {
  EXPECT_FALSE(client_->createReportingSession(1, nullptr));
  EXPECT_FALSE(client_->sendMessage(QVClientPayload(), kSessionPlayback, QVClientMessageType::stop,
                                    1, nullptr));
  for (const Call& call : service_.callsSoFar()) EXPECT_FALSE(call.answerWanted) << call.member;
}

TEST_F(QVClientCallsTest, AnErrorObjectComesBackWithDomainCodeAndText) {
  std::optional<QVClientError> outcome;
  EXPECT_FALSE(client_->sendMessage(QVClientPayload(), kSessionPlayback, QVClientMessageType::start,
                                    1, [&](const QVClientError& error) { outcome = error; }));
  service_.refuse(sentCall(), "net.quillon.audio.reporting.Code1", "reporting is switched off");
  client_->dispatch();
  ASSERT_TRUE(outcome && *outcome);
  EXPECT_EQ(outcome->code(), Code::serviceError);
  EXPECT_EQ(outcome->domain(), kQVClientReportingDomain);
  EXPECT_EQ(outcome->serviceCode(), kQVClientReportingSwitchedOff);
  EXPECT_EQ(outcome->text(), "reporting is switched off");
}

TEST_F(QVClientCallsTest, AStandardErrorComesBackByItsName) {
  for (const char* name : {"org.freedesktop.DBus.Error.InvalidArgs", "a.b.Code", "a.b.Code1x"}) {
    std::optional<QVClientResult<bool>> handled;
    EXPECT_FALSE(client_->createReportingSession(1, keepIn(handled)));
    service_.refuse(sentCall(), name, "expected x");
    client_->dispatch();
    EXPECT_EQ(handled->error().code(), Code::refused) << name;
    EXPECT_EQ(handled->error().domain(), name);
    EXPECT_EQ(handled->error().text(), "expected x");
  }
}

TEST_F(QVClientCallsTest, AnAnswerOfAnotherTypeIsAnErrorAndNoMore) {
  std::optional<QVClientResult<bool>> handled;
  EXPECT_FALSE(client_->createReportingSession(1, keepIn(handled)));
  service_.answer(sentCall(), "q", [](QVBusWriter& writer) { writer.writeNumber<uint16_t>(1); });
  client_->dispatch();
  EXPECT_EQ(handled->error().code(), Code::invalidReply);

  handled.reset();
  EXPECT_FALSE(client_->createReportingSession(2, keepIn(handled)));
  service_.answer(sentCall(), "b", [](QVBusWriter& writer) { writer.writeNumber<uint32_t>(2); });
  client_->dispatch();
  EXPECT_EQ(handled->error().code(), Code::invalidReply);

  handled.reset();
  EXPECT_FALSE(client_->createReportingSession(3, keepIn(handled)));
  service_.answerBoolean(sentCall());
  client_->dispatch();
  EXPECT_TRUE(*handled);
}

TEST_F(QVClientCallsTest, ASecondAnswerIsPassedOver) {
  int replies = 0;
  EXPECT_FALSE(client_->getServiceNameForReporterID(0, [&](const auto&) { ++replies; }));
  const Call call = sentCall();
  const auto unknown = [](QVBusWriter& writer) { writer.writeNumber<uint16_t>(65535); };
  service_.answer(call, "q", unknown);
  service_.answer(call, "q", unknown);
  client_->dispatch();
  EXPECT_EQ(replies, 1);

  EXPECT_FALSE(client_->createReportingSession(1, [&](const auto&) { ++replies; }));
  service_.answer(call, "q", unknown);
  service_.answerBoolean(sentCall());
  client_->dispatch();
  EXPECT_EQ(replies, 2);
}

TEST_F(QVClientCallsTest, AnswersFindTheirCallsInAnyOrder) {
  std::vector<int64_t> order;
  for (int64_t reporterID = 0; reporterID < 4; ++reporterID) {
    EXPECT_FALSE(client_->createReportingSession(
        reporterID, [&order, reporterID](const auto&) { order.push_back(reporterID); }));
  }
  const auto calls = service_.callsSoFar();
  for (const std::size_t index : {2U, 0U, 3U, 1U}) service_.answerBoolean(calls[index]);
  client_->dispatch();
  EXPECT_EQ(order, (std::vector<int64_t>{2, 0, 3, 1}));
}

TEST_F(QVClientCallsTest, AStartThatIsNotAnsweredHoldsUpNothing) {
  int completed = 0;
  EXPECT_FALSE(client_->startReportingSessionForID(1, [&](const auto&) { ++completed; }));
  const Call start = sentCall();
  int answered = 0;
  for (int i = 0; i < 1000; ++i) {
    EXPECT_FALSE(client_->getAllReporters([&](const auto&) { ++answered; }));
    service_.answer(sentCall(), "ax",
                    [](QVBusWriter& writer) { writer.endArray(writer.beginArray(8)); });
    client_->dispatch();
  }
  EXPECT_EQ(answered, 1000);
  EXPECT_EQ(completed, 0);
  service_.answerBoolean(start);
  client_->dispatch();
  EXPECT_EQ(completed, 1);
}

TEST_F(QVClientCallsTest, WhatTheServiceCallsOrSignalsIsPassedOver) {
  int replies = 0;
  EXPECT_FALSE(client_->createReportingSession(1, [&](const auto&) { ++replies; }));
  const Call call = sentCall();
  for (const QVBusMessageType type : {QVBusMessageType::methodCall, QVBusMessageType::signal}) {
    std::string bytes;
    QVBusWriter writer(bytes);
    writer.beginMessage(
        {.type = type, .serial = call.serial, .path = "/a", .interface = "a.b", .member = "C"});
    writer.endMessage();
    service_.send(bytes);
  }
  client_->dispatch();
  EXPECT_EQ(replies, 0);
  service_.answerBoolean(call);
  client_->dispatch();
  EXPECT_EQ(replies, 1);
}

TEST_F(QVClientCallsTest, APayloadWithAnErrorIsNotSent) {
  QVClientPayload payload;
  payload.set("bad", "\xff");
  EXPECT_EQ(client_->setConfiguration(payload, 1, nullptr).code(), Code::invalidPayload);
  EXPECT_EQ(client_->setConfigurationAndWait(payload, 1).error().code(), Code::invalidPayload);
  EXPECT_TRUE(service_.callsSoFar().empty());
}

TEST_F(QVClientCallsTest, ACallLargerThanTheWireAllowsIsNotSent) {
  QVClientPayload payload;
  payload.set("large", std::string((std::size_t{8} << 20) - 64, 'x'));
  ASSERT_TRUE(payload.ok());
  EXPECT_EQ(client_->setConfiguration(payload, 1, nullptr).code(), Code::messageTooLarge);
  EXPECT_TRUE(service_.callsSoFar().empty());
}

}  // namespace
