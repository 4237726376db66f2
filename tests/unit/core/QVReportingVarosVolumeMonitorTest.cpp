#include "QVServices/Statistics/QVReportingVarosVolumeMonitor.h"
#include "platform/fake/QVFakePlatform.h"

#include <type_traits>

#include <gmock/gmock.h>

namespace {

using Monitor = QVReportingVarosVolumeMonitor;

class SessionInformation final : public QVReportingSessionInformation {
 public:
  QVDictionary userInfo() const override { return {}; }
};

TEST(QVReportingVarosVolumeMonitorTest, CannotBeHad) {
  EXPECT_EQ(Monitor::init(), nullptr);
  static_assert(!std::is_default_constructible_v<Monitor>);
}

TEST(QVReportingVarosVolumeMonitorTest, DoesNothingWhereItIsAbsent) {
  QVFakePlatform platform;
  const auto monitor = Monitor::init();
  const auto session = std::make_shared<const SessionInformation>();
  Monitor::addSession(monitor, session);
  EXPECT_EQ(session.use_count(), 1) << "nobody keeps it";
  Monitor::removeSession(monitor, session);
  Monitor::removeSession(monitor, nullptr);
  Monitor::stop(monitor);
  Monitor::stop(monitor);
  EXPECT_TRUE(platform.log().lines().empty());
  EXPECT_TRUE(platform.runLoopThreads().threads().empty());
}

// The interface exists on every platform: its names, as they are spelled, and its types.
template <class Property>
using Value = std::invoke_result_t<Property, const Monitor&>;
static_assert(std::is_same_v<Value<decltype(&Monitor::timer)>, std::shared_ptr<QVRunLoopTimer>>);
static_assert(
    std::is_same_v<Value<decltype(&Monitor::timerThread)>, std::shared_ptr<QVRunLoopThread>>);
static_assert(
    std::is_same_v<Value<decltype(&Monitor::deviceIDs)>, std::shared_ptr<std::set<uint32_t>>>);
static_assert(std::is_same_v<Value<decltype(&Monitor::deviceIDtoName)>,
                             std::shared_ptr<std::map<uint32_t, std::string>>>);
static_assert(std::is_same_v<Value<decltype(&Monitor::deviceIDToVolume)>,
                             std::shared_ptr<std::map<uint32_t, double>>>);
static_assert(std::is_same_v<Value<decltype(&Monitor::sessions)>,
                             std::shared_ptr<std::set<Monitor::Session>>>);

}  // namespace
