#include "platform/linux/orientation/QVLinuxOrientation.h"

#include "platform/linux/QVLogException.h"
#include "platform/linux/QVThreads.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <climits>
#include <system_error>
#include <utility>

#include <poll.h>

namespace {

// Nothing that is told here is urgent.
constexpr int kNiceness = 5;

constexpr const char* kThreadName = "qv-orientation";

}  // namespace

QVLinuxOrientation::QVLinuxOrientation(QVLog& log, std::shared_ptr<QVDirectoryWatcher> watcher,
                                       std::filesystem::path uiFile,
                                       QVSensorProxyOptions sensorOptions)
    : log_(log),
      bell_(std::make_shared<const QVBell>()),
      device_(log),
      ui_(log, [uiFile] { return QVFileOrientation::valueIn(uiFile); }),
      sensor_(log, std::move(sensorOptions), device_),
      file_(log, std::move(watcher), std::move(uiFile), bell_, ui_) {}

QVLinuxOrientation::~QVLinuxOrientation() {
  std::thread thread;
  {
    const QVMutexLock lock(mutex_);
    thread.swap(thread_);
  }
  if (!thread.joinable()) return;
  isEnding_ = true;
  bell_->ring();
  thread.join();
}

void QVLinuxOrientation::QVRegisterDeviceOrientation(std::string_view callbackID,
                                                     Callback callback) {
  device_.add(callbackID, std::move(callback));
  demandChanged();
}

void QVLinuxOrientation::QVRegisterUIOrientation(std::string_view callbackID, Callback callback) {
  ui_.add(callbackID, std::move(callback));
  demandChanged();
}

void QVLinuxOrientation::QVUnregisterDeviceOrientation(std::string_view callbackID) {
  device_.remove(callbackID);
  demandChanged();
}

void QVLinuxOrientation::QVUnregisterUIOrientation(std::string_view callbackID) {
  ui_.remove(callbackID);
  demandChanged();
}

void QVLinuxOrientation::demandChanged() {
  bell_->ring();
  const QVMutexLock lock(mutex_);
  if (thread_.joinable()) return;
  try {
    thread_ = std::thread([this] { run(); });
  } catch (const std::system_error& failure) {
    log_.error(nullptr, "-[QVLinuxOrientation demandChanged]",
               "cannot follow the orientation: ", failure.what());
  }
}

void QVLinuxOrientation::run() {
  QVPrepareThread(kThreadName, kNiceness);
  while (!isEnding_) {
    // Before the work: what is rung for from here on is worked on in the next round.
    bell_->hush();
    try {
      sensor_.work();
      file_.work();
    } catch (...) {
      // For want of memory: what changes next is worked on again.
      QVLogException(log_, "-[QVLinuxOrientation run]", "thread", kThreadName);
    }
    rest();
  }
}

void QVLinuxOrientation::rest() const {
  using std::chrono::milliseconds;
  const QVSensorProxyOrientation::Rest bus = sensor_.rest();
  int limit = -1;
  if (bus.end) {
    const auto left = std::chrono::ceil<milliseconds>(*bus.end - std::chrono::steady_clock::now());
    limit = static_cast<int>(std::clamp<milliseconds::rep>(left.count(), 0, INT_MAX));
  }
  // A descriptor below 0 is passed over.
  std::array<pollfd, 2> waits{{{bell_->descriptor(), POLLIN, 0}, {bus.descriptor, bus.events, 0}}};
  poll(waits.data(), waits.size(), limit);
}
