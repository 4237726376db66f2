// What a session records of how the device is held and how its user interface is turned.

#include "tests/support/QVEndToEndTest.h"
#include "tests/support/QVFileReadings.h"
#include "tests/support/QVTestBus.h"
#include "tests/support/QVTestSensor.h"

#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include <gmock/gmock.h>

namespace {

using ::testing::AllOf;
using ::testing::Each;
using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::MatchesRegex;
using ::testing::Not;
using ::testing::SizeIs;

constexpr uint16_t kTelephony = 2;
constexpr uint16_t kGeneric = 1;

class QVOrientationTest : public QVEndToEndTest {
 protected:
  // Sessions say in the log what they hear of the orientation.
  void configure(const std::string& device) const {
    root_.configure("device.json", device);
    root_.configure("preferences/net.quillon.quietvox.json",
                    R"({"reporting_session_verbose": true})");
  }
  std::filesystem::path file() const { return root_.runtime() / "ui-orientation"; }
  void turnUI(const std::string& word) const { std::ofstream(file()) << word << '\n'; }
  // The lines about changes, from "mode=" on and without their times.
  std::vector<std::string> changes() const {
    std::vector<std::string> found;
    for (const std::string& line : log().lines("Orientation handler callback ")) {
      const std::string text = line.substr(line.find("mode="));
      const std::size_t time = text.find("time=") + 5;
      found.push_back(text.substr(0, time) + "..." + text.substr(text.find(',', time)));
    }
    return found;
  }
  // Has the service a thread for it? It has from the first session that listens on.
  bool followsOrientation() {
    const auto process = std::filesystem::path("/proc") / std::to_string(service().pid());
    for (const auto& thread : std::filesystem::directory_iterator(process / "task")) {
      std::string name;
      std::getline(std::ifstream(thread.path() / "comm") >> std::ws, name);
      if (name == "qv-orientation") return true;
    }
    return false;
  }
  std::vector<std::string> summaries() const {
    return store().rows("SELECT payload FROM beacon_message WHERE category = 65535");
  }
};

TEST_F(QVOrientationTest, IsRecordedOfTheUserInterface) {
  configure(R"({"InternalBuild": true, "DeviceClassNumber": 1})");
  turnUI("normal");
  QVFileReadings readings(file());
  auto client = connectClient();
  client.create(42, kTelephony);
  client.configure({{"HostApplicationDisplayID", "net.example.phone"}}, 42);
  client.start(42);
  client.sendMessage({{"a", 1}}, {42});
  ASSERT_TRUE(readings.await());
  turnUI("left-up");
  expectLogged("mode=ui");
  // Once the file is read again, what it said before is recorded; the same word is no change.
  static_cast<void>(readings.haveHappened());
  turnUI("left-up");
  ASSERT_TRUE(readings.await());
  client.stop(42);
  turnUI("normal");
  endService();

  EXPECT_THAT(changes(), ElementsAre("mode=ui orientation=\"left-up\" app=\"net.example.phone\", "
                                     "time=..., id=\"QVReportingService 42\""));
  EXPECT_THAT(summaries(), ElementsAre(MatchesRegex(R"(\{"QV_Session_Summary_Event":"2","a":"1",)"
                                                    R"("ui_orientation":"left-up",)"
                                                    R"("ui_orientation_time":"[0-9.]+"\})")));
}

TEST_F(QVOrientationTest, IsRecordedOfTheDevice) {
  configure(R"({"InternalBuild": true})");
  const QVTestBus bus(root_.path());
  const QVTestSensor sensor = QVTestSensor::turned(QVTestBus::address(root_.path()), "normal");
  auto client = connectClient();
  client.create(42, kTelephony);
  client.start(42);
  client.create(43, kTelephony);
  client.start(43);
  // What the daemon says before its first word is known may be that word; then it is no change.
  sensor.turn("left-up");
  sensor.turn("right-up");
  expectLogged("mode=device orientation=\"right-up\"", 2);
  EXPECT_THAT(sensor.claimants(), SizeIs(1));
  // With the next change the last one has been recorded by all.
  sensor.turn("bottom-up");
  expectLogged("mode=device orientation=\"bottom-up\"", 2);
  client.stop(42);
  sensor.turn("normal");
  sensor.turn("left-up");
  expectLogged("mode=device orientation=\"normal\"");
  client.stop(43);
  endService();
  EXPECT_THAT(sensor.claimants(), IsEmpty());

  EXPECT_THAT(summaries(), ElementsAre(AllOf(HasSubstr("right-up"), Not(HasSubstr("normal"))),
                                       HasSubstr("right-up,bottom-up")));
  EXPECT_EQ(log().count("mode=device orientation=\"normal\""), 1U);
}

TEST_F(QVOrientationTest, IsNotRecordedOfOtherDevicesAndBuilds) {
  turnUI("normal");
  std::size_t sessions = 0;
  for (const char* device :
       {R"({"InternalBuild": true, "DeviceClassNumber": 6})", R"({"DeviceClassNumber": 1})"}) {
    configure(device);
    QVFileReadings readings(file());
    auto client = connectClient();
    client.create(7, kTelephony);
    client.start(7);
    // A session that listens does so before it is stored.
    expectStored("SELECT * FROM beacon_session", ++sessions);
    EXPECT_FALSE(followsOrientation()) << device;
    client.stop(7);
    endService();
    forgetService();
    EXPECT_FALSE(readings.haveHappened()) << device;
  }
}

TEST_F(QVOrientationTest, IsNotRecordedOfOtherSessions) {
  configure(R"({"InternalBuild": true})");
  turnUI("normal");
  QVFileReadings readings(file());
  auto client = connectClient();
  client.create(7, kGeneric);
  client.start(7);
  client.create(8, kTelephony);
  client.start(8);
  ASSERT_TRUE(readings.await());
  turnUI("left-up");
  expectLogged("mode=ui orientation=\"left-up\"");
  EXPECT_TRUE(followsOrientation());
  // With the next change the last one has been told to all.
  turnUI("right-up");
  expectLogged("mode=ui orientation=\"right-up\"");
  client.stop(7);
  client.stop(8);
  endService();
  EXPECT_THAT(changes(), Each(EndsWith("id=\"QVReportingService 8\"")));
  EXPECT_THAT(changes(), SizeIs(2));
}

TEST_F(QVOrientationTest, EndsWithTheServiceWhereASessionWasNotStopped) {
  configure(R"({"InternalBuild": true})");
  turnUI("normal");
  QVFileReadings readings(file());
  auto client = connectClient();
  client.create(42, kTelephony);
  client.start(42);
  ASSERT_TRUE(readings.await());
  // From now on it does not report orientation any more: its registrations stay.
  client.setServiceType(kGeneric, 42);
  client.stop(42);
  client.destroy(42);
  turnUI("left-up");
  expectLogged("mode=ui");
  EXPECT_EQ(log().count("deallocing this session 42"), 0U);
  endService();
  EXPECT_EQ(log().count("deallocing this session 42"), 1U);
}

}  // namespace
