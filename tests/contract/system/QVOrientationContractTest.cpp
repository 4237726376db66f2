#include "platform/fake/QVFakeLog.h"
#include "platform/fake/QVFakeOrientation.h"
#include "platform/linux/orientation/QVLinuxOrientation.h"
#include "tests/support/QVTemporaryRoot.h"
#include "tests/support/QVTestBus.h"
#include "tests/support/QVTestSensor.h"
#include "tests/unit/watch/QVBusMonitor.h"
#include "tests/unit/watch/QVHeardValues.h"

#include <fstream>
#include <memory>
#include <stdexcept>
#include <string>

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

// Which of the two orientations a harness is about.
struct DeviceSide {
  static void add(QVOrientation& orientation, std::string_view id,
                  QVOrientation::Callback callback) {
    orientation.QVRegisterDeviceOrientation(id, std::move(callback));
  }
  static void remove(QVOrientation& orientation, std::string_view id) {
    orientation.QVUnregisterDeviceOrientation(id);
  }
};

struct UISide {
  static void add(QVOrientation& orientation, std::string_view id,
                  QVOrientation::Callback callback) {
    orientation.QVRegisterUIOrientation(id, std::move(callback));
  }
  static void remove(QVOrientation& orientation, std::string_view id) {
    orientation.QVUnregisterUIOrientation(id);
  }
};

// A harness's source says "normal" to begin with. settle() returns when what the source says is
// known to whoever is registered, which with all but the sensor daemon it is at once.

class FakeDeviceHarness {
 public:
  using Side = DeviceSide;
  FakeDeviceHarness() { orientation_.setDeviceOrientation(QVOrientation::kNormal); }
  QVOrientation& orientation() { return orientation_; }
  QVFakeLog& log() { return log_; }
  void settle() {}
  void turn(int32_t value) { orientation_.setDeviceOrientation(value); }

 private:
  QVFakeLog log_;
  QVFakeOrientation orientation_{log_};
};

class FakeUIHarness {
 public:
  using Side = UISide;
  FakeUIHarness() { orientation_.setUIOrientation(QVOrientation::kNormal); }
  QVOrientation& orientation() { return orientation_; }
  QVFakeLog& log() { return log_; }
  void settle() {}
  void turn(int32_t value) { orientation_.setUIOrientation(value); }

 private:
  QVFakeLog log_;
  QVFakeOrientation orientation_{log_};
};

class SensorHarness {
 public:
  using Side = DeviceSide;
  QVOrientation& orientation() { return orientation_; }
  QVFakeLog& log() { return log_; }
  void settle() { EXPECT_TRUE(monitor_.await(kReadingSeen, ++periods_)); }
  void turn(int32_t value) { sensor_.turn(std::string(QVOrientation::textOfOrientation(value))); }

 private:
  QVTemporaryRoot root_;
  QVFakeLog log_;
  const std::string address_ = QVTestBus::address(root_.path());
  QVTestBus bus_{root_.path()};
  QVBusMonitor monitor_{address_, root_.logs() / "bus"};
  QVTestSensor sensor_ = QVTestSensor::turned(address_, "normal");
  std::size_t periods_ = 0;
  QVLinuxOrientation orientation_{log_, std::make_shared<QVDirectoryWatcher>(log_),
                                  root_.runtime() / "ui-orientation",
                                  QVSensorProxyOptions{.busAddress = address_}};
};

class FileHarness {
 public:
  using Side = UISide;
  FileHarness() { turn(QVOrientation::kNormal); }
  QVOrientation& orientation() { return orientation_; }
  QVFakeLog& log() { return log_; }
  void settle() {}
  void turn(int32_t value) const {
    std::ofstream(root_.runtime() / "ui-orientation") << QVOrientation::textOfOrientation(value);
  }

 private:
  QVTemporaryRoot root_;
  QVFakeLog log_;
  QVLinuxOrientation orientation_{
      log_, std::make_shared<QVDirectoryWatcher>(log_), root_.runtime() / "ui-orientation",
      QVSensorProxyOptions{.busAddress = QVTestBus::address(root_.path())}};
};

template <class Harness>
class QVOrientationContract : public testing::Test {
 protected:
  using Side = typename Harness::Side;

  void add(const std::string& id, const std::shared_ptr<QVHeardValues>& heard) {
    Side::add(harness_->orientation(), id,
              [heard](int32_t orientation) { heard->add(orientation); });
  }
  void remove(const std::string& id) { Side::remove(harness_->orientation(), id); }
  void turn(int32_t orientation) { harness_->turn(orientation); }
  void settle() { harness_->settle(); }

  std::unique_ptr<Harness> harness_ = std::make_unique<Harness>();
  const std::shared_ptr<QVHeardValues> heard_ = std::make_shared<QVHeardValues>();
  const std::shared_ptr<QVHeardValues> other_ = std::make_shared<QVHeardValues>();
};

using Harnesses = testing::Types<FakeDeviceHarness, FakeUIHarness, SensorHarness, FileHarness>;
TYPED_TEST_SUITE(QVOrientationContract, Harnesses);

TYPED_TEST(QVOrientationContract, TellsChangesAndNothingAtRegistration) {
  this->add("id", this->heard_);
  this->settle();
  this->turn(QVOrientation::kLeftUp);
  EXPECT_THAT(this->heard_->await(1), ElementsAre(QVOrientation::kLeftUp));
  this->add("other", this->other_);
  this->turn(QVOrientation::kLeftUp);
  this->turn(QVOrientation::kUndefined);
  EXPECT_THAT(this->heard_->await(2),
              ElementsAre(QVOrientation::kLeftUp, QVOrientation::kUndefined));
  EXPECT_THAT(this->other_->await(1), ElementsAre(QVOrientation::kUndefined));
}

TYPED_TEST(QVOrientationContract, TellsNothingOnceItIsUnregistered) {
  this->add("id", this->heard_);
  this->add("other", this->other_);
  this->settle();
  this->remove("id");
  this->turn(QVOrientation::kRightUp);
  EXPECT_THAT(this->other_->await(1), ElementsAre(QVOrientation::kRightUp));
  EXPECT_THAT(this->heard_->values(), IsEmpty());
}

TYPED_TEST(QVOrientationContract, EndsTheOldestRegistrationOfAnID) {
  this->add("id", this->heard_);
  this->add("id", this->other_);
  this->settle();
  this->turn(QVOrientation::kRightUp);
  EXPECT_THAT(this->heard_->await(1), ElementsAre(QVOrientation::kRightUp));
  this->remove("id");
  this->remove("unknown");
  this->turn(QVOrientation::kBottomUp);
  EXPECT_THAT(this->other_->await(2),
              ElementsAre(QVOrientation::kRightUp, QVOrientation::kBottomUp));
  EXPECT_THAT(this->heard_->values(), ElementsAre(QVOrientation::kRightUp));
}

TYPED_TEST(QVOrientationContract, LetsACallbackUnregisterAndRegister) {
  using Where = typename TestFixture::Side;
  QVOrientation& orientation = this->harness_->orientation();
  Where::add(orientation, "id",
             [&orientation, heard = this->heard_, other = this->other_](int32_t) {
               Where::add(orientation, "other", [other](int32_t value) { other->add(value); });
               Where::remove(orientation, "id");
               heard->add(1);
             });
  this->settle();
  this->turn(QVOrientation::kRightUp);
  EXPECT_THAT(this->heard_->await(1), ElementsAre(1));
  this->turn(QVOrientation::kNormal);
  EXPECT_THAT(this->other_->await(1), ElementsAre(QVOrientation::kNormal));
  EXPECT_THAT(this->heard_->values(), ElementsAre(1));
}

TYPED_TEST(QVOrientationContract, GoesOnWhereACallbackFails) {
  using Where = typename TestFixture::Side;
  Where::add(this->harness_->orientation(), "failing",
             [](int32_t) { throw std::runtime_error("out of order"); });
  this->add("other", this->other_);
  this->settle();
  this->turn(QVOrientation::kRightUp);
  EXPECT_THAT(this->other_->await(1), ElementsAre(QVOrientation::kRightUp));
  this->remove("failing");
  this->turn(QVOrientation::kBottomUp);
  EXPECT_THAT(this->other_->await(2),
              ElementsAre(QVOrientation::kRightUp, QVOrientation::kBottomUp));
  const auto lines = this->harness_->log().lines();
  ASSERT_EQ(lines.size(), 1U);
  EXPECT_EQ(lines[0].level, QVLogLevel::error);
  EXPECT_EQ(lines[0].scope, QVFakeLog::kDefaultScope);
  EXPECT_EQ(lines[0].text, "exception in orientation callback failing: out of order");
}

TYPED_TEST(QVOrientationContract, LetsGoOfWhatACallbackHolds) {
  using Where = typename TestFixture::Side;
  const auto unregistered = std::make_shared<int>(0);
  const auto abandoned = std::make_shared<int>(0);
  Where::add(this->harness_->orientation(), "id", [unregistered](int32_t) {});
  Where::add(this->harness_->orientation(), "other", [abandoned](int32_t) {});
  this->settle();
  EXPECT_GT(unregistered.use_count(), 1);
  this->remove("id");
  EXPECT_EQ(unregistered.use_count(), 1);
  EXPECT_GT(abandoned.use_count(), 1);
  this->harness_ = nullptr;
  EXPECT_EQ(abandoned.use_count(), 1);
}

}  // namespace
