// Clients that were written in another language on implementations of the protocol of their own.

#include "tests/support/QVEndToEndTest.h"
#include "tests/support/QVSubprocess.h"

#include <gmock/gmock.h>

namespace {

using ::testing::ElementsAre;

class QVPeersTest : public QVEndToEndTest, public ::testing::WithParamInterface<const char*> {};

TEST_P(QVPeersTest, LiveThroughASession) {
  service();
  // Debian's Python has Debian's packages, whichever other one comes first in PATH.
  const auto output = QVSubprocess::run(
      {"/usr/bin/python3", QV_PEER_SCRIPTS "/" + std::string(GetParam()), address()});
  EXPECT_EQ(output.status, 0) << output.text;
  EXPECT_EQ(output.text,
            "create True\n"
            "type True\n"
            "type of 7 is 2\n"
            "type of 0 is 65535\n"
            "configure True\n"
            "valid reporterID 7 serviceType 2\n"
            "invalid reporterID 0 serviceType 65535\n"
            "all [7]\n"
            "send ()\n"
            "broadcast ()\n"
            "bad arguments org.freedesktop.DBus.Error.InvalidArgs\n"
            "bad member org.freedesktop.DBus.Error.UnknownMethod\n"
            "started is unanswered True\n"
            "stop True\n"
            "started True\n"
            "destroy True\n"
            "all []\n");
  endService();

  EXPECT_THAT(store().rows("SELECT session_id, user_info FROM beacon_session"),
              ElementsAre("7|{\"HostApplicationDisplayID\":\"net.example.peer\","
                          "\"kBeaconUserInfoClientName\":\"net.quillon.quietvox\","
                          "\"kBeaconUserInfoServiceName\":\"telephony_session\","
                          "\"rate\":48000}"));
  EXPECT_THAT(store().rows("SELECT category, type, payload FROM beacon_message ORDER BY id"),
              ElementsAre("3|1|{\"deep\":{\"list\":[1,2]},\"frames\":18446744073709551615,"
                          "\"load\":0.5,\"note\":\"\xC3\xA4 b\",\"on\":true}",
                          "7|0|{\"n\":-1}",
                          "65535|65535|{\"QV_Session_Summary_Event\":\"2\","
                          "\"deep\":\"{\\\"list\\\":[1,2]}\","
                          "\"frames\":\"18446744073709551615\",\"load\":\"0.5\",\"n\":\"-1\","
                          "\"note\":\"\xC3\xA4 b\",\"on\":\"1\"}"));
}

INSTANTIATE_TEST_SUITE_P(Implementations, QVPeersTest,
                         ::testing::Values("jeepney_peer.py", "dbus_next_peer.py"),
                         [](const auto& given) {
                           return std::string(given.param).starts_with("jeepney") ? "Jeepney"
                                                                                  : "DbusNext";
                         });

}  // namespace
