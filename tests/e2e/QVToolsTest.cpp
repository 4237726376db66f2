// The service as D-Bus tools see it: busctl (sd-bus), gdbus (GDBus), dbus-send (libdbus).

#include "tests/support/QVEndToEndTest.h"
#include "tests/support/QVSubprocess.h"

#include <gmock/gmock.h>

namespace {

using ::testing::AllOf;
using ::testing::ElementsAre;
using ::testing::HasSubstr;

using Arguments = std::vector<std::string>;

constexpr const char* kDestination = "net.quillon.quietvox";
constexpr const char* kPath = "/net/quillon/quietvox/ReportingService";
constexpr const char* kInterface = "net.quillon.quietvox.ReportingService";

constexpr uint16_t kTelephony = 2;

Arguments operator+(Arguments arguments, const Arguments& more) {
  arguments.insert(arguments.end(), more.begin(), more.end());
  return arguments;
}

// Tools hold a connection for one call only, so the sessions that they speak of are those of a
// client that stays.
class QVToolsTest : public QVEndToEndTest {
 protected:
  void SetUp() override {
    owner_.create(7, kTelephony);
    owner_.start(7);
  }

  static void expectAnswer(const Arguments& command, const std::string& answer) {
    const auto output = QVSubprocess::run(command);
    EXPECT_EQ(output.status, 0) << ::testing::PrintToString(command) << output.text;
    EXPECT_EQ(output.text, answer) << ::testing::PrintToString(command);
  }
  static void expectFailure(const Arguments& command, const std::string& text) {
    const auto output = QVSubprocess::run(command);
    EXPECT_NE(output.status, 0) << ::testing::PrintToString(command);
    EXPECT_THAT(output.text, HasSubstr(text)) << ::testing::PrintToString(command);
  }

  // What a SendMessage and a broadcast by a tool leave in the store, with the given application
  // as sent along.
  void expectMessagesStored(const std::string& payload) {
    endService();
    EXPECT_THAT(store().rows("SELECT session_id, category, type, payload FROM beacon_message "
                             "WHERE category <> 65535"),
                ElementsAre("7|3|1|" + payload, "7|3|1|" + payload));
  }

  QVPeerClient owner_{connectClient()};
};

class QVBusctlTest : public QVToolsTest {
 protected:
  Arguments busctl(const Arguments& arguments) const {
    return Arguments{"busctl", "--address=" + address(), "--no-pager"} + arguments;
  }
  Arguments call(const std::string& member, const Arguments& arguments = {}) const {
    return busctl(Arguments{"call", kDestination, kPath, kInterface, member} + arguments);
  }
};

TEST_F(QVBusctlTest, CallsEveryOperation) {
  expectAnswer(call("CreateReportingSession", {"x", "8"}), "b true\n");
  expectAnswer(call("SetServiceType", {"qx", "3", "8"}), "b true\n");
  expectAnswer(call("GetServiceNameForReporterID", {"x", "7"}), "q 2\n");
  expectAnswer(call("SetConfiguration", {"a{sv}x", "2", "rate", "u", "48000", "nested", "a{sv}",
                                         "1", "a", "ai", "2", "1", "2", "8"}),
               "b true\n");
  // The session runs, so there is nothing to wait for.
  expectAnswer(call("StartReportingSessionForID", {"x", "7"}), "b true\n");
  expectAnswer(call("ReporterIDValid", {"x", "7"}),
               "a{sv} 2 \"reporterID\" x 7 \"serviceType\" q 2\n");
  expectAnswer(call("ReporterIDValid", {"x", "8"}),
               "a{sv} 2 \"reporterID\" x 0 \"serviceType\" q 65535\n");
  expectAnswer(call("GetAllReporters"), "ax 1 7\n");
  const Arguments message{"a{sv}uqbax", "2", "frames", "t",         "512",
                          "note",       "s", "a b",    "134217731", "1"};
  expectAnswer(call("SendMessage", message + Arguments{"false", "1", "7"}), "");
  expectAnswer(call("SendMessage", message + Arguments{"true", "0"}), "");
  expectAnswer(call("StopReportingSessionForID", {"x", "7"}), "b true\n");
  expectAnswer(call("DestroyReportingSession", {"x", "7"}), "b true\n");
  expectMessagesStored(R"({"frames":512,"note":"a b"})");
}

TEST_F(QVBusctlTest, StartsWithoutWaitingForTheReply) {
  owner_.create(8, kTelephony);
  expectAnswer(busctl({"--expect-reply=no", "call", kDestination, kPath, kInterface,
                       "StartReportingSessionForID", "x", "8"}),
               "");
  owner_.awaitOperations();
  owner_.sendMessage({{"a", 1}}, {8});
  endService();
  EXPECT_EQ(store().rows("SELECT session_id FROM beacon_session"), (Arguments{"7", "8"}));
}

TEST_F(QVBusctlTest, KillsTheService) {
  expectFailure(call("KillService"), "");
  EXPECT_EQ(service().wait(), 2);
}

TEST_F(QVBusctlTest, ShowsErrors) {
  expectFailure(call("SendMessage", {"a{sv}uqbax", "0", "0", "0", "true", "1", "7"}),
                "every session");
  expectFailure(call("CreateReportingSession", {"u", "8"}), "takes \"x\"");
  expectFailure(call("NoSuchMember"), "NoSuchMember");
  expectFailure(busctl({"call", kDestination, "/nowhere", kInterface, "GetAllReporters"}),
                "/nowhere");
  expectFailure(busctl({"call", kDestination, kPath, "net.example.None", "GetAllReporters"}),
                "net.example.None");
}

TEST_F(QVBusctlTest, IntrospectsTheObject) {
  const auto output = QVSubprocess::run(busctl({"introspect", kDestination, kPath}));
  EXPECT_EQ(output.status, 0) << output.text;
  for (const char* member :
       {".CreateReportingSession", ".SetServiceType", ".GetServiceNameForReporterID",
        ".SetConfiguration", ".StartReportingSessionForID", ".SendMessage",
        ".StopReportingSessionForID", ".DestroyReportingSession", ".ReporterIDValid",
        ".GetAllReporters", ".KillService"}) {
    EXPECT_THAT(output.text, HasSubstr(member));
  }
  EXPECT_THAT(output.text, AllOf(HasSubstr("a{sv}uqbax"), HasSubstr("org.freedesktop.DBus.Peer"),
                                 HasSubstr("org.freedesktop.DBus.Properties")));
}

TEST_F(QVBusctlTest, ShowsTheTree) {
  const auto output = QVSubprocess::run(busctl({"tree", "--list", kDestination}));
  EXPECT_EQ(output.status, 0) << output.text;
  EXPECT_THAT(output.text, HasSubstr(std::string(kPath) + "\n"));
}

TEST_F(QVBusctlTest, ListsNames) {
  const auto output = QVSubprocess::run(busctl({"list", "--no-legend"}));
  EXPECT_EQ(output.status, 0) << output.text;
  EXPECT_THAT(output.text, HasSubstr(kDestination));
}

class QVGdbusTest : public QVToolsTest {
 protected:
  Arguments call(const std::string& method, const Arguments& arguments = {}) const {
    return Arguments{"gdbus",
                     "call",
                     "--address",
                     address(),
                     "--dest",
                     kDestination,
                     "--object-path",
                     kPath,
                     "--method",
                     method.find('.') == std::string::npos ? std::string(kInterface) + "." + method
                                                           : method,
                     "--timeout",
                     "30"} +
           arguments;
  }
};

TEST_F(QVGdbusTest, CallsEveryOperation) {
  expectAnswer(call("CreateReportingSession", {"int64 8"}), "(true,)\n");
  expectAnswer(call("SetServiceType", {"uint16 3", "int64 8"}), "(true,)\n");
  expectAnswer(call("GetServiceNameForReporterID", {"int64 7"}), "(uint16 2,)\n");
  expectAnswer(call("SetConfiguration", {"{'rate': <uint32 48000>, 'list': <[1, 2]>}", "int64 8"}),
               "(true,)\n");
  expectAnswer(call("StartReportingSessionForID", {"int64 7"}), "(true,)\n");
  expectAnswer(call("ReporterIDValid", {"int64 7"}),
               "({'reporterID': <int64 7>, 'serviceType': <uint16 2>},)\n");
  expectAnswer(call("GetAllReporters"), "([int64 7],)\n");
  const Arguments message{"{'frames': <512>, 'note': <'a b'>}", "uint32 134217731", "uint16 1"};
  expectAnswer(call("SendMessage", message + Arguments{"false", "[int64 7]"}), "()\n");
  expectAnswer(call("SendMessage", message + Arguments{"true", "@ax []"}), "()\n");
  expectAnswer(call("StopReportingSessionForID", {"int64 7"}), "(true,)\n");
  expectAnswer(call("DestroyReportingSession", {"int64 7"}), "(true,)\n");
  expectMessagesStored(R"({"frames":512,"note":"a b"})");
}

TEST_F(QVGdbusTest, TakesTheFirstOfTwoReplies) {
  expectAnswer(call("GetServiceNameForReporterID", {"int64 0"}), "(uint16 65535,)\n");
}

TEST_F(QVGdbusTest, ShowsErrors) {
  expectFailure(call("SendMessage", {"{'a': <1>}", "uint32 3", "uint16 1", "true", "[int64 7]"}),
                "org.freedesktop.DBus.Error.InvalidArgs");
  expectFailure(call("NoSuchMember"), "org.freedesktop.DBus.Error.UnknownMethod");
  expectFailure(call("net.example.None.Call"), "org.freedesktop.DBus.Error.UnknownInterface");
}

TEST_F(QVGdbusTest, IntrospectsTheTree) {
  const auto output = QVSubprocess::run({"gdbus", "introspect", "--address", address(), "--dest",
                                         kDestination, "--object-path", "/", "--recurse"});
  EXPECT_EQ(output.status, 0) << output.text;
  EXPECT_THAT(output.text,
              AllOf(HasSubstr(kPath), HasSubstr("interface " + std::string(kInterface)),
                    HasSubstr("SendMessage(in  a{sv} message,"), HasSubstr("KillService(out b")));
}

TEST_F(QVGdbusTest, PingsAndAsksForTheMachine) {
  expectAnswer(call("org.freedesktop.DBus.Peer.Ping"), "()\n");
  expectAnswer(call("org.freedesktop.DBus.Properties.GetAll", {"''"}), "(@a{sv} {},)\n");
}

// dbus-send can neither say a{sv} nor do without knowing what it says.
class QVDbusSendTest : public QVToolsTest, public ::testing::WithParamInterface<const char*> {
 protected:
  Arguments call(const std::string& method, const Arguments& arguments = {}) const {
    return Arguments{"dbus-send",
                     GetParam() + address(),
                     "--print-reply=literal",
                     std::string("--dest=") + kDestination,
                     kPath,
                     std::string(kInterface) + "." + method} +
           arguments;
  }
};

TEST_P(QVDbusSendTest, CallsWhatItHasTypesFor) {
  expectAnswer(call("CreateReportingSession", {"int64:8"}), "   boolean true\n");
  expectAnswer(call("SetServiceType", {"uint16:3", "int64:8"}), "   boolean true\n");
  expectAnswer(call("GetServiceNameForReporterID", {"int64:7"}), "   uint16 2\n");
  expectAnswer(call("StartReportingSessionForID", {"int64:7"}), "   boolean true\n");
  const auto valid = QVSubprocess::run(call("ReporterIDValid", {"int64:7"}));
  EXPECT_THAT(valid.text, AllOf(HasSubstr("int64 7"), HasSubstr("uint16 2")));
  const auto reporters = QVSubprocess::run(call("GetAllReporters"));
  EXPECT_THAT(reporters.text, HasSubstr("int64 7"));
  expectAnswer(call("StopReportingSessionForID", {"int64:7"}), "   boolean true\n");
  expectAnswer(call("DestroyReportingSession", {"int64:7"}), "   boolean true\n");
}

TEST_P(QVDbusSendTest, ShowsWhatWasExpected) {
  expectFailure(call("SetConfiguration", {"dict:string:string:a,b", "int64:7"}), "a{sv}x");
  expectFailure(call("CreateReportingSession", {"string:seven"}), "InvalidArgs");
  expectServes(owner_);
}

INSTANTIATE_TEST_SUITE_P(Connections, QVDbusSendTest, ::testing::Values("--peer=", "--bus="),
                         [](const auto& given) {
                           return given.param[2] == 'p' ? "AsPeer" : "AsIfOnABus";
                         });

}  // namespace
