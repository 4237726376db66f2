// The device's orientation, from a sensor daemon on a bus.

#include "platform/fake/QVFakeLog.h"
#include "platform/linux/orientation/QVLinuxOrientation.h"
#include "tests/support/QVTemporaryRoot.h"
#include "tests/support/QVTestBus.h"
#include "tests/support/QVTestSensor.h"
#include "tests/unit/watch/QVBusMonitor.h"
#include "tests/unit/watch/QVHeardValues.h"

#include <chrono>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <poll.h>

namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

constexpr int32_t kUndefined = QVOrientation::kUndefined;
constexpr int32_t kNormal = QVOrientation::kNormal;
constexpr int32_t kLeftUp = QVOrientation::kLeftUp;
constexpr int32_t kRightUp = QVOrientation::kRightUp;

constexpr const char* kNoDaemonSeen = "error_name=org.freedesktop.DBus.Error.ServiceUnknown";

class QVSensorProxyOrientationTest : public testing::Test {
 protected:
  void startBus() {
    bus_.emplace(root_.path());
    monitor_.emplace(address(), root_.logs() / "bus");
  }
  void startSensor(const std::string& orientation) {
    sensor_ = nullptr;
    sensor_ = std::make_unique<QVTestSensor>(QVTestSensor::turned(address(), orientation));
  }
  void startScriptedSensor() {
    sensor_ = std::make_unique<QVTestSensor>(QVTestSensor::scripted(address()));
  }
  std::string address() const { return QVTestBus::address(root_.path()); }
  void makeOrientation(const QVSensorProxyOptions& options) {
    orientation_ = nullptr;
    orientation_ =
        std::make_unique<QVLinuxOrientation>(log_, std::make_shared<QVDirectoryWatcher>(log_),
                                             root_.runtime() / "ui-orientation", options);
  }
  // A signal that somebody who is not the daemon sends to the service alone, which claimed.
  void forge(const std::vector<std::string>& signal) const {
    std::vector<std::string> command{"busctl", "--address=" + address(),
                                     "--destination=" + sensor_->claimants().at(0), "emit"};
    command.insert(command.end(), signal.begin(), signal.end());
    const auto emitted = QVSubprocess::run(command);
    ASSERT_EQ(emitted.status, 0) << emitted.text;
  }

  void add(const std::string& callbackID = "id") { add(callbackID, heard_); }
  void add(const std::string& callbackID, QVHeardValues& heard) {
    orientation_->QVRegisterDeviceOrientation(
        callbackID, [&heard](int32_t orientation) { heard.add(orientation); });
  }
  void remove(const std::string& callbackID = "id") {
    orientation_->QVUnregisterDeviceOrientation(callbackID);
  }
  // Registers, and what the daemon says first is known: it is read before it can be changed.
  void addAndSettle() {
    const std::size_t before = monitor_->count(kReadingSeen);
    add();
    ASSERT_TRUE(monitor_->await(kReadingSeen, before + 1));
  }
  // The same, and the answer is under way: the daemon may go.
  void addAndLearn() {
    addAndSettle();
    EXPECT_THAT(sensor_->claimants(), SizeIs(1));
  }
  void turn(const std::string& orientation) const { sensor_->turn(orientation); }
  // Works on the test's thread; the limit only ends a test that has failed.
  static void workUntil(QVSensorProxyOrientation& sensor, const std::function<bool()>& isOver) {
    const auto limit = std::chrono::steady_clock::now() + std::chrono::minutes(1);
    for (sensor.work(); !isOver(); sensor.work()) {
      ASSERT_LT(std::chrono::steady_clock::now(), limit);
      const auto rest = sensor.rest();
      pollfd event{rest.descriptor, rest.events, 0};
      ::poll(&event, 1, rest.end ? 1 : 60'000);
    }
  }

  QVHeardValues heard_;
  QVTemporaryRoot root_;
  QVFakeLog log_;
  std::optional<QVTestBus> bus_;
  std::optional<QVBusMonitor> monitor_;
  std::unique_ptr<QVTestSensor> sensor_;
  std::unique_ptr<QVLinuxOrientation> orientation_ = std::make_unique<QVLinuxOrientation>(
      log_, std::make_shared<QVDirectoryWatcher>(log_), root_.runtime() / "ui-orientation",
      QVSensorProxyOptions{.busAddress = address(), .firstRetry = std::chrono::milliseconds(10)});
};

TEST_F(QVSensorProxyOrientationTest, TellsEachChangeAndNothingAtRegistration) {
  startBus();
  startSensor("normal");
  addAndSettle();
  turn("left-up");
  EXPECT_THAT(heard_.await(1), ElementsAre(kLeftUp));
  turn("bottom-up");
  EXPECT_THAT(heard_.await(2), ElementsAre(kLeftUp, QVOrientation::kBottomUp));
  turn("undefined");
  turn("right-up");
  EXPECT_THAT(heard_.await(4),
              ElementsAre(kLeftUp, QVOrientation::kBottomUp, kUndefined, kRightUp));
  EXPECT_THAT(log_.renderings(), IsEmpty());
}

TEST_F(QVSensorProxyOrientationTest, ClaimsTheAccelerometerWhileSomebodyIsRegistered) {
  startBus();
  startSensor("normal");
  EXPECT_THAT(sensor_->claimants(), IsEmpty());
  addAndSettle();
  const auto first = sensor_->claimants();
  EXPECT_THAT(first, SizeIs(1));
  remove();
  ASSERT_TRUE(monitor_->await(kReleaseSeen));
  EXPECT_THAT(sensor_->claimants(), IsEmpty());
  // Another connection: the first one was closed.
  ASSERT_TRUE(monitor_->await("string \"" + first.at(0) + '"', 3));
  addAndSettle();
  EXPECT_THAT(sensor_->claimants(), SizeIs(1));
  EXPECT_NE(sensor_->claimants(), first);
}

TEST_F(QVSensorProxyOrientationTest, SharesAClaimBetweenRegistrations) {
  startBus();
  startSensor("normal");
  QVHeardValues other;
  addAndSettle();
  add("other", other);
  turn("left-up");
  EXPECT_THAT(heard_.await(1), ElementsAre(kLeftUp));
  EXPECT_THAT(other.await(1), ElementsAre(kLeftUp));
  remove();
  turn("normal");
  EXPECT_THAT(other.await(2), ElementsAre(kLeftUp, kNormal));
  EXPECT_THAT(heard_.values(), ElementsAre(kLeftUp));
  EXPECT_EQ(monitor_->count(kClaimSeen), 1U);
  EXPECT_EQ(monitor_->count(kReleaseSeen), 0U);
  remove("other");
  EXPECT_TRUE(monitor_->await(kReleaseSeen));
}

TEST_F(QVSensorProxyOrientationTest, BeginsAnewWithEachPeriodOfDemand) {
  startBus();
  startSensor("normal");
  addAndSettle();
  remove();
  ASSERT_TRUE(monitor_->await(kReleaseSeen));
  turn("left-up");
  addAndSettle();
  turn("normal");
  EXPECT_THAT(heard_.await(1), ElementsAre(kNormal));
}

TEST_F(QVSensorProxyOrientationTest, ReleasesTheClaimAtItsEnd) {
  startBus();
  startSensor("normal");
  addAndSettle();
  orientation_ = nullptr;
  EXPECT_TRUE(monitor_->await(kReleaseSeen));
  EXPECT_THAT(sensor_->claimants(), IsEmpty());
}

TEST_F(QVSensorProxyOrientationTest, LetsACallbackUnregisterItself) {
  startBus();
  startSensor("normal");
  addAndSettle();
  orientation_->QVRegisterDeviceOrientation("own", [this](int32_t orientation) {
    heard_.add(10 + orientation);
    remove("own");
  });
  turn("left-up");
  EXPECT_THAT(heard_.await(2), ElementsAre(kLeftUp, 10 + kLeftUp));
  turn("normal");
  EXPECT_THAT(heard_.await(3), ElementsAre(kLeftUp, 10 + kLeftUp, kNormal));
}

// ---- A daemon that comes and goes

TEST_F(QVSensorProxyOrientationTest, IsUndefinedUntilADaemonAppears) {
  startBus();
  add();
  ASSERT_TRUE(monitor_->await(kNoDaemonSeen));
  startSensor("left-up");
  EXPECT_THAT(heard_.await(1), ElementsAre(kLeftUp));
  EXPECT_THAT(sensor_->claimants(), SizeIs(1));
  turn("normal");
  EXPECT_THAT(heard_.await(2), ElementsAre(kLeftUp, kNormal));
  EXPECT_THAT(log_.renderings(),
              ElementsAre("6[default] -[QVSensorProxyOrientation note:]: the device's orientation "
                          "is undefined, org.freedesktop.DBus.Error.ServiceUnknown: The name "
                          "net.hadess.SensorProxy was not provided by any .service files"));
}

TEST_F(QVSensorProxyOrientationTest, ClaimsADaemonAgainThatRestarts) {
  startBus();
  startSensor("normal");
  addAndLearn();
  sensor_ = nullptr;
  EXPECT_THAT(heard_.await(1), ElementsAre(kUndefined));
  startSensor("right-up");
  EXPECT_THAT(heard_.await(2), ElementsAre(kUndefined, kRightUp));
  EXPECT_THAT(sensor_->claimants(), SizeIs(1));
}

TEST_F(QVSensorProxyOrientationTest, FollowsADaemonThatTakesAnothersPlace) {
  startBus();
  startSensor("normal");
  addAndLearn();
  const QVTestSensor successor = QVTestSensor::turned(address(), "right-up");
  EXPECT_THAT(heard_.await(2), ElementsAre(kUndefined, kRightUp));
  EXPECT_THAT(successor.claimants(), SizeIs(1));
}

TEST_F(QVSensorProxyOrientationTest, ListensToNobodyButTheDaemon) {
  startBus();
  startSensor("normal");
  addAndSettle();
  forge({"/net/hadess/SensorProxy", "org.freedesktop.DBus.Properties", "PropertiesChanged",
         "sa{sv}as", "net.hadess.SensorProxy", "1", "AccelerometerOrientation", "s", "left-up",
         "0"});
  ASSERT_TRUE(monitor_->await("string \"left-up\""));
  turn("right-up");
  EXPECT_THAT(heard_.await(1), ElementsAre(kRightUp));
}

TEST_F(QVSensorProxyOrientationTest, BelievesTheBusAloneWhoOwnsTheDaemonsName) {
  startBus();
  startSensor("normal");
  addAndSettle();
  forge({"/org/freedesktop/DBus", "org.freedesktop.DBus", "NameOwnerChanged", "sss",
         "net.hadess.SensorProxy", ":1.4711", ""});
  ASSERT_TRUE(monitor_->await("string \":1.4711\""));
  turn("right-up");
  EXPECT_THAT(heard_.await(1), ElementsAre(kRightUp));
  EXPECT_EQ(monitor_->count(kClaimSeen), 1U);
}

TEST_F(QVSensorProxyOrientationTest, AsksTheBusForNobodyElsesChanges) {
  startBus();
  startSensor("normal");
  addAndSettle();
  EXPECT_EQ(monitor_->count("member='PropertiesChanged'"), 1U);
  EXPECT_EQ(monitor_->count("type='signal',sender='net.hadess.SensorProxy'"), 1U);
}

TEST_F(QVSensorProxyOrientationTest, ReleasesAClaimThatWasNotAnsweredYet) {
  startBus();
  startSensor("normal");
  sensor_->signal(SIGSTOP);
  add();
  ASSERT_TRUE(monitor_->await(kClaimSeen));
  remove();
  EXPECT_TRUE(monitor_->await(kReleaseSeen));
  sensor_->signal(SIGCONT);
  EXPECT_THAT(sensor_->claimants(), IsEmpty());
  EXPECT_THAT(heard_.values(), IsEmpty());
}

TEST_F(QVSensorProxyOrientationTest, ClaimsAgainWhileTheReleaseIsNotAnswered) {
  startBus();
  startSensor("normal");
  addAndSettle();
  sensor_->signal(SIGSTOP);
  remove();
  ASSERT_TRUE(monitor_->await(kReleaseSeen));
  add();
  ASSERT_TRUE(monitor_->await(kClaimSeen, 2));
  sensor_->signal(SIGCONT);
  ASSERT_TRUE(monitor_->await(kReadingSeen, 2));
  EXPECT_THAT(sensor_->claimants(), SizeIs(1));
  turn("left-up");
  EXPECT_THAT(heard_.await(1), ElementsAre(kLeftUp));
}

TEST_F(QVSensorProxyOrientationTest, EndsWhileTheDaemonDoesNotAnswer) {
  startBus();
  startSensor("normal");
  sensor_->signal(SIGSTOP);
  add();
  ASSERT_TRUE(monitor_->await(kClaimSeen));
  orientation_ = nullptr;
  EXPECT_THAT(heard_.values(), IsEmpty());
}

// ---- A daemon that misbehaves

TEST_F(QVSensorProxyOrientationTest, IsUndefinedWhereTheDaemonRefuses) {
  // No second claim is under way when the daemon leaves.
  makeOrientation({.busAddress = address(), .firstRetry = std::chrono::minutes(10)});
  startBus();
  startScriptedSensor();
  sensor_->addMethod("ClaimAccelerometer",
                     "raise dbus.exceptions.DBusException('not you', name='net.hadess.Refused')");
  sensor_->addProperty("AccelerometerOrientation", "s", "left-up");
  add();
  ASSERT_TRUE(monitor_->await("error_name=net.hadess.Refused"));
  // Nobody listens to what it says all the same.
  sensor_->changeProperty("AccelerometerOrientation", "s", "right-up");
  startSensor("normal");
  EXPECT_THAT(heard_.await(1), ElementsAre(kNormal));
  EXPECT_EQ(monitor_->count(kReadingSeen), 1U);
  EXPECT_THAT(log_.renderings(),
              ElementsAre("6[default] -[QVSensorProxyOrientation note:]: the device's orientation "
                          "is undefined, net.hadess.Refused: not you"));
}

TEST_F(QVSensorProxyOrientationTest, ClaimsAgainWhereTheDaemonRefused) {
  startBus();
  startScriptedSensor();
  sensor_->addMethod("ClaimAccelerometer",
                     "raise dbus.exceptions.DBusException('not yet', name='net.hadess.Refused')");
  sensor_->addProperty("AccelerometerOrientation", "s", "left-up");
  add();
  ASSERT_TRUE(monitor_->await("error_name=net.hadess.Refused", 3));
  EXPECT_THAT(heard_.values(), IsEmpty());
  sensor_->addMethod("ClaimAccelerometer", "");
  EXPECT_THAT(heard_.await(1), ElementsAre(kLeftUp));
  EXPECT_THAT(log_.renderings(),
              ElementsAre("6[default] -[QVSensorProxyOrientation note:]: the device's orientation "
                          "is undefined, net.hadess.Refused: not yet"));
}

TEST_F(QVSensorProxyOrientationTest, ClaimsAgainWhereTheDaemonDidNotAnswer) {
  makeOrientation({.busAddress = address(),
                   .firstRetry = std::chrono::milliseconds(10),
                   .answerLimit = std::chrono::seconds(2)});
  startBus();
  startSensor("left-up");
  sensor_->signal(SIGSTOP);
  add();
  ASSERT_TRUE(monitor_->await(kClaimSeen, 2));
  EXPECT_THAT(heard_.values(), IsEmpty());
  sensor_->signal(SIGCONT);
  EXPECT_THAT(heard_.await(1), ElementsAre(kLeftUp));
  EXPECT_THAT(log_.renderings(),
              ElementsAre("6[default] -[QVSensorProxyOrientation note:]: the device's orientation "
                          "is undefined, org.freedesktop.DBus.Error.NoReply: Method call timed "
                          "out"));
}

// The test's thread is the orientation's.
TEST_F(QVSensorProxyOrientationTest, ClaimsNoMoreOnceNobodyIsRegistered) {
  startBus();
  startScriptedSensor();
  sensor_->addMethod("ClaimAccelerometer",
                     "raise dbus.exceptions.DBusException('not you', name='net.hadess.Refused')");
  QVOrientationRegistrations registrations(log_);
  QVSensorProxyOrientation sensor(log_, {.busAddress = address()}, registrations);
  registrations.add("id", [this](int32_t orientation) { heard_.add(orientation); });
  workUntil(sensor, [this] { return !log_.lines().empty(); });
  EXPECT_GE(sensor.rest().descriptor, 0);
  EXPECT_TRUE(sensor.rest().end.has_value());
  registrations.remove("id");
  sensor.work();
  EXPECT_EQ(sensor.rest().descriptor, -1);
  EXPECT_FALSE(sensor.rest().end.has_value());
}

// A daemon that nobody provides appears by itself: until then there is nothing to wake up for.
TEST_F(QVSensorProxyOrientationTest, RestsWithoutALimitWhereThereIsNoDaemon) {
  startBus();
  QVOrientationRegistrations registrations(log_);
  QVSensorProxyOrientation sensor(log_, {.busAddress = address()}, registrations);
  registrations.add("id", [this](int32_t orientation) { heard_.add(orientation); });
  workUntil(sensor, [this] { return !log_.lines().empty(); });
  EXPECT_GE(sensor.rest().descriptor, 0);
  EXPECT_FALSE(sensor.rest().end.has_value());
}

TEST_F(QVSensorProxyOrientationTest, TakesNonsenseForUndefined) {
  startBus();
  startScriptedSensor();
  sensor_->addMethod("ClaimAccelerometer", "");
  sensor_->addMethod("ReleaseAccelerometer", "");
  sensor_->addProperty("AccelerometerOrientation", "i", "3");
  sensor_->addProperty("SomethingElse", "s", "left-up");
  addAndSettle();
  sensor_->changeProperty("AccelerometerOrientation", "s", "left-up");
  EXPECT_THAT(heard_.await(1), ElementsAre(kLeftUp));
  sensor_->changeProperty("AccelerometerOrientation", "s", "sideways");
  EXPECT_THAT(heard_.await(2), ElementsAre(kLeftUp, kUndefined));
  sensor_->changeProperty("SomethingElse", "s", "normal");
  sensor_->changeProperty("AccelerometerOrientation", "s", "normal");
  EXPECT_THAT(heard_.await(3), ElementsAre(kLeftUp, kUndefined, kNormal));
  sensor_->changeProperty("AccelerometerOrientation", "as", "0");
  EXPECT_THAT(heard_.await(4), ElementsAre(kLeftUp, kUndefined, kNormal, kUndefined));
}

TEST_F(QVSensorProxyOrientationTest, IsUndefinedWhereTheDaemonHasNoSuchProperty) {
  startBus();
  startScriptedSensor();
  sensor_->addMethod("ClaimAccelerometer", "");
  add();
  ASSERT_TRUE(monitor_->await(kReadingSeen));
  sensor_->addProperty("AccelerometerOrientation", "s", "undefined");
  sensor_->changeProperty("AccelerometerOrientation", "s", "normal");
  EXPECT_THAT(heard_.await(1), ElementsAre(kNormal));
}

// ---- A bus that comes and goes

// The test's thread is the orientation's.
TEST_F(QVSensorProxyOrientationTest, IsUndefinedUntilThereIsABus) {
  QVOrientationRegistrations registrations(log_);
  QVSensorProxyOrientation sensor(
      log_, {.busAddress = address(), .firstRetry = std::chrono::milliseconds(1)}, registrations);
  sensor.work();
  EXPECT_EQ(sensor.rest().descriptor, -1);
  EXPECT_FALSE(sensor.rest().end.has_value());

  registrations.add("id", [this](int32_t orientation) { heard_.add(orientation); });
  sensor.work();
  EXPECT_EQ(sensor.rest().descriptor, -1);
  EXPECT_TRUE(sensor.rest().end.has_value());
  EXPECT_THAT(log_.renderings(),
              ElementsAre("6[default] -[QVSensorProxyOrientation note:]: the device's orientation "
                          "is undefined, the system bus: No such file or directory"));
  startBus();
  startSensor("left-up");
  workUntil(sensor, [this] { return !heard_.values().empty(); });
  EXPECT_THAT(heard_.values(), ElementsAre(kLeftUp));

  registrations.remove("id");
  workUntil(sensor, [&sensor] { return sensor.rest().descriptor < 0; });
  EXPECT_EQ(sensor.rest().descriptor, -1);
  EXPECT_FALSE(sensor.rest().end.has_value());
}

TEST_F(QVSensorProxyOrientationTest, ConnectsAgainToABusThatRestarts) {
  startBus();
  startSensor("normal");
  addAndLearn();
  monitor_.reset();
  bus_.reset();
  EXPECT_THAT(heard_.await(1), ElementsAre(kUndefined));
  bus_.emplace(root_.path());
  startSensor("right-up");
  EXPECT_THAT(heard_.await(2), ElementsAre(kUndefined, kRightUp));
}

// The test's thread is the orientation's.
TEST_F(QVSensorProxyOrientationTest, ConnectsNoMoreOnceNobodyIsRegistered) {
  QVOrientationRegistrations registrations(log_);
  QVSensorProxyOrientation sensor(
      log_, {.busAddress = address(), .firstRetry = std::chrono::milliseconds(0)}, registrations);
  registrations.add("id", [this](int32_t orientation) { heard_.add(orientation); });
  sensor.work();
  EXPECT_TRUE(sensor.rest().end.has_value());
  registrations.remove("id");
  startBus();
  sensor.work();
  EXPECT_EQ(sensor.rest().descriptor, -1);
  EXPECT_FALSE(sensor.rest().end.has_value());
  EXPECT_THAT(heard_.values(), IsEmpty());
}

// The test's thread is the orientation's.
TEST_F(QVSensorProxyOrientationTest, ToleratesAnAddressThatIsNone) {
  QVOrientationRegistrations registrations(log_);
  QVSensorProxyOrientation sensor(log_, {.busAddress = "nonsense"}, registrations);
  registrations.add("id", [this](int32_t orientation) { heard_.add(orientation); });
  sensor.work();
  EXPECT_EQ(sensor.rest().descriptor, -1);
  EXPECT_TRUE(sensor.rest().end.has_value());
  EXPECT_THAT(heard_.values(), IsEmpty());
  EXPECT_THAT(log_.renderings(),
              ElementsAre("6[default] -[QVSensorProxyOrientation note:]: the device's orientation "
                          "is undefined, the system bus: Connection refused"));
}

TEST(QVSensorProxyAddressTest, IsTheSystemBusWhereTheEnvironmentSaysNothing) {
  ::unsetenv("DBUS_SYSTEM_BUS_ADDRESS");
  EXPECT_EQ(QVSensorProxyOrientation::systemBusAddress(), "unix:path=/run/dbus/system_bus_socket");
  ::setenv("DBUS_SYSTEM_BUS_ADDRESS", "unix:path=/elsewhere", 1);
  EXPECT_EQ(QVSensorProxyOrientation::systemBusAddress(), "unix:path=/elsewhere");
  ::unsetenv("DBUS_SYSTEM_BUS_ADDRESS");
}

}  // namespace
