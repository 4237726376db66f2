#include "platform/fake/QVFakeOrientation.h"

#include "platform/QVText.h"

#include <algorithm>
#include <exception>
#include <utility>

bool QVFakeOrientation::Side::holds(const std::shared_ptr<Registration>& registration) const {
  return std::ranges::find(registrations, registration) != registrations.end();
}

void QVFakeOrientation::QVRegisterDeviceOrientation(std::string_view callbackID,
                                                    Callback callback) {
  registerCallback(device_, callbackID, std::move(callback));
}

void QVFakeOrientation::QVRegisterUIOrientation(std::string_view callbackID, Callback callback) {
  registerCallback(ui_, callbackID, std::move(callback));
}

void QVFakeOrientation::QVUnregisterDeviceOrientation(std::string_view callbackID) {
  unregisterCallback(device_, callbackID);
}

void QVFakeOrientation::QVUnregisterUIOrientation(std::string_view callbackID) {
  unregisterCallback(ui_, callbackID);
}

void QVFakeOrientation::setDeviceOrientation(int32_t orientation) {
  setOrientation(device_, orientation);
}

void QVFakeOrientation::setUIOrientation(int32_t orientation) {
  setOrientation(ui_, orientation);
}

std::vector<std::string> QVFakeOrientation::deviceCallbackIDs() const {
  return callbackIDs(device_);
}

std::vector<std::string> QVFakeOrientation::uiCallbackIDs() const {
  return callbackIDs(ui_);
}

std::vector<std::string> QVFakeOrientation::calls() const {
  const std::lock_guard lock(mutex_);
  return calls_;
}

void QVFakeOrientation::abandonRegistrations() {
  // What callbacks hold is destroyed without the lock.
  std::deque<std::shared_ptr<Registration>> device;
  std::deque<std::shared_ptr<Registration>> ui;
  const std::lock_guard lock(mutex_);
  device.swap(device_.registrations);
  ui.swap(ui_.registrations);
}

void QVFakeOrientation::registerCallback(Side& side, std::string_view callbackID,
                                         Callback callback) {
  if (callbackID.empty()) misuse_.note("a registration without an ID");
  if (!callback) {
    misuse_.note(QVText("a registration without a callback: ", callbackID));
    return;
  }
  const std::lock_guard lock(mutex_);
  calls_.push_back(QVText("register ", side.name, ' ', callbackID));
  side.registrations.push_back(
      std::make_shared<Registration>(std::string(callbackID), std::move(callback)));
}

void QVFakeOrientation::unregisterCallback(Side& side, std::string_view callbackID) {
  // What the callback holds is destroyed without the lock.
  std::shared_ptr<Registration> ended;
  const std::lock_guard lock(mutex_);
  calls_.push_back(QVText("unregister ", side.name, ' ', callbackID));
  const auto oldest = std::ranges::find(side.registrations, callbackID,
                                        [](const auto& entry) { return entry->callbackID; });
  if (oldest == side.registrations.end()) return;
  ended = std::move(*oldest);
  side.registrations.erase(oldest);
}

void QVFakeOrientation::setOrientation(Side& side, int32_t orientation) {
  std::deque<std::shared_ptr<Registration>> told;
  {
    const std::lock_guard lock(mutex_);
    if (side.orientation == orientation) return;
    side.orientation = orientation;
    told = side.registrations;
  }
  for (const auto& registration : told) {
    {
      const std::lock_guard lock(mutex_);
      if (!side.holds(registration)) continue;
    }
    try {
      registration->callback(orientation);
    } catch (const std::exception& exception) {
      log_.error(nullptr, __func__, "exception in orientation callback ", registration->callbackID,
                 ": ", exception.what());
    } catch (...) {
      log_.error(nullptr, __func__, "exception in orientation callback ", registration->callbackID,
                 ": of unknown type");
    }
  }
}

std::vector<std::string> QVFakeOrientation::callbackIDs(const Side& side) const {
  const std::lock_guard lock(mutex_);
  std::vector<std::string> callbackIDs;
  for (const auto& registration : side.registrations) {
    callbackIDs.push_back(registration->callbackID);
  }
  return callbackIDs;
}
