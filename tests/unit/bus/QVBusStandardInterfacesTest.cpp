#include "platform/linux/bus/QVBusObjectTree.h"
#include "platform/linux/bus/QVBusStandardInterfaces.h"
#include "platform/linux/bus/QVReportingServiceInterface.h"
#include "tests/unit/bus/QVBusFixture.h"

#include <string>
#include <vector>

#include <gmock/gmock.h>

using testing::HasSubstr;
using testing::Not;

namespace {

constexpr const char* kBusPath = "/org/freedesktop/DBus";
constexpr const char* kServicePath = "/net/quillon/quietvox/ReportingService";

QVTestMessage toBus(std::string member, std::string signature = "", std::string body = "") {
  return {.path = kBusPath,
          .interface = "org.freedesktop.DBus",
          .member = std::move(member),
          .destination = "org.freedesktop.DBus",
          .signature = std::move(signature),
          .body = std::move(body)};
}

QVTestMessage introspect(std::string path) {
  return {.path = std::move(path),
          .interface = "org.freedesktop.DBus.Introspectable",
          .member = "Introspect"};
}

std::string string(std::string_view text) {
  return QVTestWire().string(text).bytes;
}

std::vector<std::string> strings(const QVBusAnswer& answer) {
  EXPECT_EQ(answer.signature, "as");
  QVBusReader reader(answer.body, false);
  std::vector<std::string> texts;
  const std::size_t end = reader.enterArray(4);
  while (reader.position() < end) texts.emplace_back(reader.readString());
  reader.leaveArray(end);
  return texts;
}

uint32_t number(const QVBusAnswer& answer) {
  EXPECT_EQ(answer.signature, "u");
  return QVBusReader(answer.body, false).readNumber<uint32_t>();
}

}  // namespace

class QVBusStandardInterfacesTest : public QVBusFixture {
 protected:
  void SetUp() override { connect(); }
};

TEST_F(QVBusStandardInterfacesTest, DescribesTheServiceInFull) {
  const auto document = call(introspect(kServicePath)).text();
  for (const auto& member : kReportingServiceMembers) {
    EXPECT_THAT(document, HasSubstr("<method name=\"" + std::string(member.member) + "\">"));
  }
  EXPECT_THAT(document, HasSubstr("    <method name=\"SendMessage\">\n"
                                  "      <arg name=\"message\" type=\"a{sv}\" direction=\"in\"/>\n"
                                  "      <arg name=\"category\" type=\"u\" direction=\"in\"/>\n"
                                  "      <arg name=\"type\" type=\"q\" direction=\"in\"/>\n"
                                  "      <arg name=\"everySession\" type=\"b\" direction=\"in\"/>\n"
                                  "      <arg name=\"reporterIDs\" type=\"ax\" direction=\"in\"/>\n"
                                  "    </method>\n"));
  EXPECT_THAT(document, HasSubstr("<interface name=\"org.freedesktop.DBus.Peer\">"));
  EXPECT_THAT(document, Not(HasSubstr("<node name=")));
}

TEST_F(QVBusStandardInterfacesTest, LeadsFromTheRootToTheObjects) {
  const auto root = call(introspect("/")).text();
  EXPECT_THAT(root, HasSubstr("<node name=\"net\"/>"));
  EXPECT_THAT(root, HasSubstr("<node name=\"org\"/>"));
  EXPECT_THAT(call(introspect("/net")).text(), HasSubstr("<node name=\"quillon\"/>"));
  EXPECT_THAT(call(introspect("/net/quillon")).text(), HasSubstr("<node name=\"quietvox\"/>"));
  EXPECT_THAT(call(introspect("/net/quillon/quietvox")).text(),
              HasSubstr("<node name=\"ReportingService\"/>"));
  EXPECT_THAT(call(introspect("/org/freedesktop")).text(), HasSubstr("<node name=\"DBus\"/>"));
  EXPECT_THAT(call(introspect(kBusPath)).text(), HasSubstr("<method name=\"Hello\">"));
  for (const auto* path : {"/ne", "/nets", "/net/quillon/quietvox/ReportingService/x", "/other"}) {
    EXPECT_EQ(call(introspect(path)).error, "org.freedesktop.DBus.Error.UnknownObject") << path;
  }
}

TEST_F(QVBusStandardInterfacesTest, AnswersPingsAtAnyPath) {
  for (const auto* path : {"/", kServicePath, kBusPath, "/anywhere"}) {
    EXPECT_EQ(call({.path = path, .interface = "org.freedesktop.DBus.Peer", .member = "Ping"}),
              (QVBusAnswer{1, "", "", ""}));
  }
  EXPECT_EQ(call({.interface = "org.freedesktop.DBus.Peer", .member = "Pong"}).error,
            "org.freedesktop.DBus.Error.UnknownMethod");
}

TEST_F(QVBusStandardInterfacesTest, TellsTheMachineOrThatItHasNoID) {
  const auto answer = call({.interface = "org.freedesktop.DBus.Peer", .member = "GetMachineId"});
  if (answer.error.empty()) {
    EXPECT_EQ(answer.text().size(), 32U);
  } else {
    EXPECT_EQ(answer.error, "org.freedesktop.DBus.Error.FileNotFound");
  }
}

TEST_F(QVBusStandardInterfacesTest, HasNoProperties) {
  QVTestMessage message{.interface = "org.freedesktop.DBus.Properties",
                        .member = "GetAll",
                        .signature = "s",
                        .body = string("net.quillon.quietvox.ReportingService")};
  const auto all = call(message);
  EXPECT_EQ(all.signature, "a{sv}");
  EXPECT_EQ(all.body, QVTestWire().u32(0).align(8).bytes);
  message.body = string("");
  EXPECT_EQ(call(message).error, "");
  message.body = string("a.b");
  EXPECT_EQ(call(message).error, "org.freedesktop.DBus.Error.UnknownInterface");

  message.member = "Get";
  message.signature = "ss";
  message.body = QVTestWire().string("org.freedesktop.DBus.Peer").string("Version").bytes;
  EXPECT_EQ(call(message).error, "org.freedesktop.DBus.Error.UnknownProperty");
  message.member = "Set";
  message.signature = "ssv";
  message.body += QVTestWire().signature("y").u8(1).bytes;
  EXPECT_EQ(call(message).error, "org.freedesktop.DBus.Error.UnknownProperty");
}

TEST_F(QVBusStandardInterfacesTest, NamesEachConnection) {
  connect();
  EXPECT_EQ(call(toBus("Hello"), 1).text(), ":1.1");
  EXPECT_EQ(call(toBus("Hello"), 2).text(), ":1.2");
}

TEST_F(QVBusStandardInterfacesTest, TakesRulesOfSignalsThatNeverCome) {
  EXPECT_EQ(call(toBus("AddMatch", "s", string("type='signal'"))), (QVBusAnswer{1, "", "", ""}));
  EXPECT_EQ(call(toBus("RemoveMatch", "s", string("type='signal'"))), (QVBusAnswer{1, "", "", ""}));
}

TEST_F(QVBusStandardInterfacesTest, KnowsTheNamesOfTheService) {
  EXPECT_EQ(call(toBus("GetNameOwner", "s", string("net.quillon.quietvox"))).text(), ":1.0");
  EXPECT_EQ(call(toBus("GetNameOwner", "s", string("org.freedesktop.DBus"))).text(),
            "org.freedesktop.DBus");
  EXPECT_EQ(call(toBus("GetNameOwner", "s", string(":1.1"))).text(), ":1.1");
  EXPECT_EQ(call(toBus("GetNameOwner", "s", string("a.b"))).error,
            "org.freedesktop.DBus.Error.NameHasNoOwner");
  EXPECT_TRUE(call(toBus("NameHasOwner", "s", string("net.quillon.quietvox"))).boolean());
  EXPECT_FALSE(call(toBus("NameHasOwner", "s", string("a.b"))).boolean());
  EXPECT_THAT(strings(call(toBus("ListNames"))),
              testing::ElementsAre("org.freedesktop.DBus", ":1.0", ":1.1", "net.quillon.quietvox",
                                   "net.quillon.quietvox.ReportingService"));
  EXPECT_THAT(strings(call(toBus("ListActivatableNames"))),
              testing::ElementsAre("org.freedesktop.DBus", "net.quillon.quietvox",
                                   "net.quillon.quietvox.ReportingService"));
}

TEST_F(QVBusStandardInterfacesTest, GivesNamesAwayButNotItsOwn) {
  const auto withFlags = [](std::string_view name) {
    return QVTestWire().string(name).u32(0).bytes;
  };
  EXPECT_EQ(number(call(toBus("RequestName", "su", withFlags("a.b")))), 1U);
  EXPECT_EQ(number(call(toBus("RequestName", "su", withFlags("net.quillon.quietvox")))), 3U);
  EXPECT_EQ(number(call(toBus("ReleaseName", "s", string("a.b")))), 1U);
  EXPECT_EQ(number(call(toBus("ReleaseName", "s", string("net.quillon.quietvox")))), 3U);
  EXPECT_EQ(number(call(toBus("StartServiceByName", "su", withFlags("net.quillon.quietvox")))), 2U);
  EXPECT_EQ(call(toBus("StartServiceByName", "su", withFlags("a.b"))).error,
            "org.freedesktop.DBus.Error.ServiceUnknown");
}

TEST_F(QVBusStandardInterfacesTest, ChecksSignatures) {
  const auto answer = call(toBus("AddMatch", "u", QVTestWire().u32(1).bytes));
  EXPECT_EQ(answer.error, "org.freedesktop.DBus.Error.InvalidArgs");
  EXPECT_EQ(answer.text(), "AddMatch takes \"s\", not \"u\"");
}

TEST_F(QVBusStandardInterfacesTest, IsABusOnlyAtItsPath) {
  auto message = toBus("Hello");
  message.path = kServicePath;
  EXPECT_EQ(call(message).error, "org.freedesktop.DBus.Error.UnknownInterface");
  EXPECT_EQ(call(toBus("Unknown")).error, "org.freedesktop.DBus.Error.UnknownMethod");
}

TEST_F(QVBusStandardInterfacesTest, AnswersWithoutTheExportedObject) {
  call(introspect(kServicePath));
  call(toBus("Hello"));
  EXPECT_TRUE(service().calls.empty());
}
