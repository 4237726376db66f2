#include "platform/QVText.h"
#include "platform/fake/QVFakeLog.h"
#include "platform/fake/QVFakeOrientation.h"

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class QVFakeOrientationTest : public testing::Test {
 protected:
  // What a callback is told is noted as "NOTE VALUE".
  QVOrientation::Callback callback(std::string_view note) {
    return [this, note](int32_t value) { told_.push_back(QVText(note, ' ', value)); };
  }

  QVFakeLog log_;
  QVFakeOrientation orientation_{log_};
  std::vector<std::string> told_;
};

TEST_F(QVFakeOrientationTest, TellsValuesThatDifferFromTheLast) {
  orientation_.setDeviceOrientation(QVOrientation::kNormal);
  orientation_.QVRegisterDeviceOrientation("a", callback("device"));
  orientation_.QVRegisterUIOrientation("a", callback("ui"));
  EXPECT_THAT(told_, IsEmpty()) << "registering tells nothing";
  orientation_.setDeviceOrientation(QVOrientation::kNormal);
  orientation_.setUIOrientation(QVOrientation::kUndefined);
  EXPECT_THAT(told_, IsEmpty()) << "neither value is another than before";
  orientation_.setDeviceOrientation(QVOrientation::kLeftUp);
  orientation_.setDeviceOrientation(QVOrientation::kLeftUp);
  orientation_.setUIOrientation(QVOrientation::kBottomUp);
  orientation_.setDeviceOrientation(QVOrientation::kUndefined);
  EXPECT_THAT(told_, ElementsAre("device 3", "ui 2", "device 0"));
}

TEST_F(QVFakeOrientationTest, EndsTheOldestRegistrationOfAnID) {
  orientation_.QVRegisterDeviceOrientation("a", callback("first"));
  orientation_.QVRegisterDeviceOrientation("b", callback("other"));
  orientation_.QVRegisterDeviceOrientation("a", callback("second"));
  EXPECT_THAT(orientation_.deviceCallbackIDs(), ElementsAre("a", "b", "a"));
  EXPECT_THAT(orientation_.uiCallbackIDs(), IsEmpty());
  orientation_.setDeviceOrientation(1);
  EXPECT_THAT(told_, ElementsAre("first 1", "other 1", "second 1"));
  told_.clear();
  orientation_.QVUnregisterDeviceOrientation("a");
  orientation_.setDeviceOrientation(2);
  EXPECT_THAT(told_, ElementsAre("other 2", "second 2"));
  orientation_.QVUnregisterDeviceOrientation("a");
  orientation_.QVUnregisterDeviceOrientation("a");
  EXPECT_THAT(orientation_.deviceCallbackIDs(), ElementsAre("b"));
}

TEST_F(QVFakeOrientationTest, KeepsTheOrderOfCalls) {
  orientation_.QVRegisterDeviceOrientation("a", callback(""));
  orientation_.QVRegisterUIOrientation("a", callback(""));
  orientation_.QVUnregisterDeviceOrientation("a");
  orientation_.QVUnregisterUIOrientation("a");
  orientation_.QVUnregisterUIOrientation("unknown");
  EXPECT_THAT(orientation_.calls(),
              ElementsAre("register device a", "register ui a", "unregister device a",
                          "unregister ui a", "unregister ui unknown"));
}

TEST_F(QVFakeOrientationTest, MayBeCalledFromACallback) {
  orientation_.QVRegisterUIOrientation("a", [this](int32_t) {
    told_.emplace_back("a");
    orientation_.QVUnregisterUIOrientation("a");
    orientation_.QVUnregisterUIOrientation("b");
    orientation_.QVRegisterUIOrientation("c", callback("c"));
  });
  orientation_.QVRegisterUIOrientation("b", callback("b"));
  orientation_.setUIOrientation(1);
  EXPECT_THAT(told_, ElementsAre("a")) << "b was unregistered before its turn, c is new";
  orientation_.setUIOrientation(2);
  EXPECT_THAT(told_, ElementsAre("a", "c 2"));
}

TEST_F(QVFakeOrientationTest, DropsCallbacksWithTheirRegistrations) {
  const auto captured = std::make_shared<int>();
  orientation_.QVRegisterDeviceOrientation("a", [captured](int32_t) {});
  orientation_.QVRegisterUIOrientation("a", [captured](int32_t) {});
  orientation_.QVUnregisterDeviceOrientation("a");
  EXPECT_EQ(captured.use_count(), 2);
  orientation_.abandonRegistrations();
  EXPECT_EQ(captured.use_count(), 1);
  EXPECT_THAT(orientation_.uiCallbackIDs(), IsEmpty());
}

TEST_F(QVFakeOrientationTest, NotesMisuse) {
  orientation_.QVRegisterDeviceOrientation("a", nullptr);
  orientation_.QVRegisterUIOrientation("", callback(""));
  EXPECT_THAT(orientation_.takeMisuses(),
              ElementsAre("a registration without a callback: a", "a registration without an ID"));
}

}  // namespace
