#include "platform/QVText.h"
#include "platform/linux/bus/QVReportingServiceExporter.h"
#include "tests/unit/bus/QVBusFixture.h"

#include <optional>
#include <string>
#include <vector>

namespace {

constexpr const char* kInvalidArgs = "org.freedesktop.DBus.Error.InvalidArgs";

QVTestMessage sendMessage(bool everySession, const std::vector<int64_t>& reporterIDs,
                          const char* type = "s") {
  QVTestWire body;
  body.array(8, [type](QVTestWire& wire) {
    wire.entry("k", type);
    if (*type == 's') {
      wire.string("v");
    } else {
      wire.u32(0);
    }
  });
  body.u32(0x00010002).u16(3).u32(everySession ? 1 : 0);
  body.array(8, [&reporterIDs](QVTestWire& wire) {
    for (const int64_t reporterID : reporterIDs) wire.i64(reporterID);
  });
  return {.member = "SendMessage", .signature = "a{sv}uqbax", .body = body.bytes};
}

QVTestMessage onReporter(std::string member, int64_t reporterID) {
  return {
      .member = std::move(member), .signature = "x", .body = QVTestWire().i64(reporterID).bytes};
}

}  // namespace

class QVReportingServiceExporterTest : public QVBusFixture {
 protected:
  void SetUp() override { connect(); }
};

TEST_F(QVReportingServiceExporterTest, CarriesOutEveryOperationOnAReporter) {
  EXPECT_TRUE(call(onReporter("CreateReportingSession", 7)).boolean());
  EXPECT_TRUE(call({.member = "SetServiceType",
                    .signature = "qx",
                    .body = QVTestWire().u16(11).i64(7).bytes})
                  .boolean());
  const auto type = call(onReporter("GetServiceNameForReporterID", 7));
  EXPECT_EQ(type.signature, "q");
  EXPECT_EQ(type.body, QVTestWire().u16(11).bytes);
  EXPECT_TRUE(exchange(onReporter("StartReportingSessionForID", 7).bytes()).empty()) << "deferred";
  EXPECT_EQ(exchange(onReporter("StopReportingSessionForID", 7).bytes()).size(), 2U)
      << "the start's answer and its own";
  EXPECT_TRUE(call(onReporter("DestroyReportingSession", 7)).boolean());
  EXPECT_EQ(service().calls,
            (std::vector<std::string>{"create 7", "setServiceType 7", "getServiceName 7", "start 7",
                                      "stop 7", "destroy 7"}));
}

TEST_F(QVReportingServiceExporterTest, AnswersTheValidityWithTheTypesOfTheContract) {
  const auto expected = [](int64_t reporterID, uint16_t serviceType) {
    QVTestWire wire;
    wire.array(8, [&](QVTestWire& entries) {
      entries.entry("reporterID", "x").i64(reporterID);
      entries.entry("serviceType", "q").u16(serviceType);
    });
    return wire.bytes;
  };
  const auto unknown = call(onReporter("ReporterIDValid", 9));
  EXPECT_EQ(unknown.signature, "a{sv}");
  EXPECT_EQ(unknown.body, expected(0, 65535));
  call(onReporter("CreateReportingSession", -9));
  EXPECT_EQ(call(onReporter("ReporterIDValid", -9)).body, expected(-9, 0));
}

TEST_F(QVReportingServiceExporterTest, ListsTheReporters) {
  const QVTestMessage getAll{.member = "GetAllReporters"};
  const auto none = call(getAll);
  EXPECT_EQ(none.signature, "ax");
  EXPECT_EQ(none.body, QVTestWire().u32(0).align(8).bytes);
  call(onReporter("CreateReportingSession", 3));
  call(onReporter("CreateReportingSession", -1));
  EXPECT_EQ(call(getAll).body, QVTestWire().u32(16).i64(-1).i64(3).bytes);
}

TEST_F(QVReportingServiceExporterTest, HandsOverTheConfiguration) {
  QVTestWire body;
  body.array(8, [](QVTestWire& wire) { wire.entry("rate", "u").u32(48000); }).i64(5);
  EXPECT_TRUE(
      call({.member = "SetConfiguration", .signature = "a{sv}x", .body = body.bytes}).boolean());
  EXPECT_EQ(service().sessions.at(5).configuration, (QVDictionary{{"rate", 48000}}));
  EXPECT_EQ(server_->budget().total(), service().sessions.at(5).configuration.footprint());
}

TEST_F(QVReportingServiceExporterTest, HandsOverAMessageForTheSessionsListed) {
  const auto answer = call(sendMessage(false, {5, -6}));
  EXPECT_EQ(answer, (QVBusAnswer{1, "", "", ""}));
  ASSERT_EQ(service().messages.size(), 1U);
  const auto& message = service().messages[0];
  EXPECT_EQ(message.payload, (QVDictionary{{"k", "v"}}));
  EXPECT_EQ(message.category, 0x00010002U);
  EXPECT_EQ(message.type, 3);
  EXPECT_EQ(message.reporterIDs, (std::vector<int64_t>{5, -6}));
}

TEST_F(QVReportingServiceExporterTest, TellsNoListFromAnEmptyList) {
  call(sendMessage(false, {}));
  call(sendMessage(true, {}));
  ASSERT_EQ(service().messages.size(), 2U);
  EXPECT_EQ(service().messages[0].reporterIDs, std::vector<int64_t>{});
  EXPECT_EQ(service().messages[1].reporterIDs, std::nullopt);
}

TEST_F(QVReportingServiceExporterTest, RefusesAListForEverySession) {
  const auto answer = call(sendMessage(true, {5}));
  EXPECT_EQ(answer.error, kInvalidArgs);
  EXPECT_EQ(answer.text(), "SendMessage to every session takes no list of reporter IDs");
  EXPECT_TRUE(service().calls.empty());
  // Also where reporting is switched off: it is looked at first.
  service().enabled = false;
  EXPECT_EQ(call(sendMessage(true, {5})).error, kInvalidArgs);
}

TEST_F(QVReportingServiceExporterTest, RefusesFileDescriptors) {
  const auto answer = call(sendMessage(false, {5}, "h"));
  EXPECT_EQ(answer.error, kInvalidArgs);
  EXPECT_EQ(answer.text(), "file descriptors are not taken");
  QVTestWire body;
  body.array(8, [](QVTestWire& wire) { wire.entry("k", "h").u32(0); }).i64(5);
  EXPECT_EQ(call({.member = "SetConfiguration", .signature = "a{sv}x", .body = body.bytes}).error,
            kInvalidArgs);
  EXPECT_TRUE(service().calls.empty());
  EXPECT_EQ(server_->budget().total(), 0U);
}

TEST_F(QVReportingServiceExporterTest, RefusesMoreReporterIDsThanAConnectionMayHaveSessions) {
  EXPECT_EQ(call(sendMessage(false, std::vector<int64_t>(65'536, 5))).error, "");
  EXPECT_EQ(service().calls.size(), 1U);
  const auto answer = call(sendMessage(false, std::vector<int64_t>(65'537, 5)));
  EXPECT_EQ(answer.error, kInvalidArgs);
  EXPECT_EQ(answer.text(), "SendMessage takes no more than 65536 reporter IDs");
  EXPECT_EQ(service().calls.size(), 1U);
}

TEST_F(QVReportingServiceExporterTest, RefusesMoreValuesThanMemoryIsToHold) {
  const auto bytes = [](std::size_t count) {
    QVTestWire body;
    body.array(8, [count](QVTestWire& wire) {
      wire.entry("k", "ay").array(1, [count](QVTestWire& items) {
        for (std::size_t i = 0; i < count; ++i) items.u8(1);
      });
    });
    return body.i64(5).bytes;
  };
  // The entry itself is a value, too.
  constexpr std::size_t kMost = std::size_t{512} << 10;
  EXPECT_EQ(
      call({.member = "SetConfiguration", .signature = "a{sv}x", .body = bytes(kMost - 1)}).error,
      "");
  const auto answer =
      call({.member = "SetConfiguration", .signature = "a{sv}x", .body = bytes(kMost)});
  EXPECT_EQ(answer.error, kInvalidArgs);
  EXPECT_EQ(answer.text(), "no more than 524288 values are taken");
}

TEST_F(QVReportingServiceExporterTest, TurnsAnErrorObjectIntoAnError) {
  service().enabled = false;
  const auto answer = call(sendMessage(false, {5}));
  EXPECT_EQ(answer.error, "net.quillon.audio.reporting.Code1");
  EXPECT_EQ(answer.text(), "reporting is switched off");
}

TEST_F(QVReportingServiceExporterTest, NamesWhatWasExpectedAndWhatCame) {
  const auto answer =
      call({.member = "SendMessage", .signature = "s", .body = QVTestWire().string("x").bytes});
  EXPECT_EQ(answer.error, kInvalidArgs);
  EXPECT_EQ(answer.text(), "SendMessage takes \"a{sv}uqbax\", not \"s\"");
  for (const auto& member : kReportingServiceMembers) {
    const auto wrong = call({.member = std::string(member.member),
                             .signature = "d",
                             .body = QVTestWire().real(1).bytes});
    EXPECT_EQ(wrong.error, kInvalidArgs) << member.member;
    EXPECT_EQ(wrong.text(), QVText(member.member, " takes \"", member.in, "\", not \"d\""));
  }
  EXPECT_TRUE(service().calls.empty());
}

TEST_F(QVReportingServiceExporterTest, FindsTheMemberWithoutAnInterface) {
  auto message = onReporter("CreateReportingSession", 4);
  message.interface.clear();
  EXPECT_TRUE(call(message).boolean());
  EXPECT_EQ(call({.interface = "", .member = "Ping"}).error, "");
  EXPECT_EQ(call({.interface = "", .member = "Unknown"}).error,
            "org.freedesktop.DBus.Error.UnknownMethod");
}

TEST_F(QVReportingServiceExporterTest, IgnoresTheDestination) {
  auto message = onReporter("CreateReportingSession", 4);
  message.destination = "some.other.service";
  EXPECT_TRUE(call(message).boolean());
}

TEST_F(QVReportingServiceExporterTest, AnswersWhatIsNotThereWithTheStandardErrors) {
  auto message = onReporter("CreateReportingSession", 4);
  message.path = "/net/quillon/other";
  EXPECT_EQ(call(message).error, "org.freedesktop.DBus.Error.UnknownObject");
  message = onReporter("CreateReportingSession", 4);
  message.interface = "net.quillon.other";
  EXPECT_EQ(call(message).error, "org.freedesktop.DBus.Error.UnknownInterface");
  message = onReporter("createReportingSession", 4);
  EXPECT_EQ(call(message).error, "org.freedesktop.DBus.Error.UnknownMethod");
  message = onReporter("CreateReportingSession", 4);
  message.path = "/net/quillon/quietvox";
  EXPECT_EQ(call(message).error, "org.freedesktop.DBus.Error.UnknownInterface");
  EXPECT_TRUE(service().calls.empty());
}

TEST_F(QVReportingServiceExporterTest, TakesBodiesThatBreakTheRulesForViolations) {
  // A boolean of 2 within the expected signature.
  auto message = sendMessage(false, {});
  message.body.replace(message.body.size() - 8, 4, std::string("\2\0\0\0", 4));
  peer().send(message.bytes());
  run();
  EXPECT_TRUE(peer().isClosed());
  EXPECT_TRUE(service().calls.empty());
  ASSERT_EQ(logged().size(), 1U);
}

TEST_F(QVReportingServiceExporterTest, TakesBodiesLongerThanTheirSignatureForViolations) {
  for (const auto& [member, signature] : std::vector<std::pair<std::string, std::string>>{
           {"CreateReportingSession", "x"}, {"GetAllReporters", ""}, {"SetServiceType", "qx"}}) {
    connect();
    auto body = signature == "qx" ? QVTestWire().u16(1).i64(2).u8(0).bytes
                                  : QVTestWire().i64(2).u8(0).bytes;
    peers_.back()->send(
        QVTestMessage{.member = member, .signature = signature, .body = body}.bytes());
    run();
    EXPECT_TRUE(peers_.back()->isClosed()) << member;
    EXPECT_TRUE(services_.back()->calls.empty()) << member;
  }
}

TEST_F(QVReportingServiceExporterTest, ExportsNothingWithoutAnInterfaceOrObject) {
  const auto connection = accept();
  connection->setExportedObject(services_[0]);
  connection->resume();
  peer(2).send(QVBusPeer::authentication());
  run();
  peer(2).receive();
  EXPECT_EQ(call(onReporter("CreateReportingSession", 4), 2).error,
            "org.freedesktop.DBus.Error.UnknownObject");
  EXPECT_TRUE(service().calls.empty());
}
