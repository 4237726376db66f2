#include "platform/linux/orientation/QVOrientationRegistrations.h"

#include "platform/linux/QVLogException.h"

#include <algorithm>
#include <atomic>
#include <utility>

struct QVOrientationRegistrations::Registration {
  const std::string callbackID;
  QVOrientation::Callback callback;  // the orientation thread's
  std::atomic<bool> isOver{false};

  Registration(std::string_view itsID, QVOrientation::Callback itsCallback)
      : callbackID(itsID), callback(std::move(itsCallback)) {}
};

void QVOrientationRegistrations::add(std::string_view callbackID,
                                     QVOrientation::Callback callback) {
  // Goes after the lock where there is no room for it, with its callback.
  auto registration = std::make_shared<Registration>(callbackID, std::move(callback));
  bool isFirstDropped = false;
  {
    const QVMutexLock lock(mutex_);
    if (registrations_.size() < kMaximumRegistrations) {
      if (registrations_.empty()) {
        known_ = baseline_ ? std::optional(baseline_()) : std::nullopt;
        ++lastPeriod_;
      }
      registrations_.push_back(std::move(registration));
      return;
    }
    isFirstDropped = !std::exchange(hasDropped_, true);
  }
  if (!isFirstDropped) return;
  log_.error(nullptr, "-[QVOrientationRegistrations add:callback:]", "orientation callback ",
             callbackID, " is not registered: there are ", kMaximumRegistrations);
}

void QVOrientationRegistrations::remove(std::string_view callbackID) {
  std::shared_ptr<Registration> over;  // goes after the lock, with its callback
  const QVMutexLock lock(mutex_);
  const auto oldest = std::ranges::find(registrations_, callbackID,
                                        [](const auto& entry) { return entry->callbackID; });
  if (oldest == registrations_.end()) return;
  over = std::move(*oldest);
  over->isOver = true;
  registrations_.erase(oldest);
  hasDropped_ = false;
}

QVOrientationRegistrations::Period QVOrientationRegistrations::period() const {
  const QVMutexLock lock(mutex_);
  return registrations_.empty() ? kNoDemand : lastPeriod_;
}

void QVOrientationRegistrations::report(Period period, int32_t orientation) {
  std::vector<std::shared_ptr<Registration>> told;
  {
    const QVMutexLock lock(mutex_);
    if (period != lastPeriod_ || registrations_.empty()) return;
    if (known_ == orientation) return;
    // First, so that a change for which there is no memory now is one again the next time.
    if (known_) told = registrations_;
    known_ = orientation;
  }
  for (const auto& registration : told) {
    if (registration->isOver) continue;
    try {
      registration->callback(orientation);
    } catch (...) {
      QVLogException(log_, "-[QVOrientationRegistrations report:orientation:]",
                     "orientation callback", registration->callbackID);
    }
  }
}
