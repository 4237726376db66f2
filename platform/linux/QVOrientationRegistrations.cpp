#include "platform/linux/QVOrientationRegistrations.h"

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
  auto registration = std::make_shared<Registration>(callbackID, std::move(callback));
  const QVMutexLock lock(mutex_);
  if (registrations_.empty()) {
    ++lastPeriod_;
    known_.reset();
  }
  registrations_.push_back(std::move(registration));
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
    const bool isFirst = !known_;
    if (std::exchange(known_, orientation) == orientation || isFirst) return;
    told = registrations_;
  }
  for (const auto& registration : told) {
    if (!registration->isOver) registration->callback(orientation);
  }
}
