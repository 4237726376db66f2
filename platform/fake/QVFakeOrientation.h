#pragma once

#include "platform/QVLog.h"
#include "platform/QVOrientation.h"
#include "platform/fake/QVFakeMisuse.h"

#include <deque>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

// An orientation service for tests: it turns when told. Both values are undefined to begin with.
//
// Callbacks run on the thread that sets a value, with no lock held, in the order of registration;
// one that was unregistered before its turn came is not called. Checks that a registration has an
// ID and a callback. It has no limit.
//
// Threads: any. The log outlives it.
class QVFakeOrientation final : public QVOrientation {
 public:
  explicit QVFakeOrientation(QVLog& log) : log_(log) {}

  void QVRegisterDeviceOrientation(std::string_view callbackID, Callback callback) override;
  void QVRegisterUIOrientation(std::string_view callbackID, Callback callback) override;
  void QVUnregisterDeviceOrientation(std::string_view callbackID) override;
  void QVUnregisterUIOrientation(std::string_view callbackID) override;

  // Tell a value that differs from the last one; the same one again is not told.
  void setDeviceOrientation(int32_t orientation);
  void setUIOrientation(int32_t orientation);

  // The IDs of what is registered now, in the order of registration.
  std::vector<std::string> deviceCallbackIDs() const;
  std::vector<std::string> uiCallbackIDs() const;
  // All registrations and unregistrations in order: "register device ID", "unregister ui ID".
  std::vector<std::string> calls() const;

  // Drops all registrations with what their callbacks hold; no calls are noted for it.
  void abandonRegistrations();
  std::vector<std::string> takeMisuses() { return misuse_.take(); }

 private:
  struct Registration {
    std::string callbackID;
    Callback callback;
  };
  // One of the two things that turn. All guarded by mutex_.
  struct Side {
    std::string_view name;
    int32_t orientation = kUndefined;
    std::deque<std::shared_ptr<Registration>> registrations{};

    bool holds(const std::shared_ptr<Registration>& registration) const;
  };

  void registerCallback(Side& side, std::string_view callbackID, Callback callback);
  void unregisterCallback(Side& side, std::string_view callbackID);
  void setOrientation(Side& side, int32_t orientation);
  std::vector<std::string> callbackIDs(const Side& side) const;

  QVLog& log_;
  QVFakeMisuse misuse_{"QVFakeOrientation"};
  mutable std::mutex mutex_;
  // Guarded by mutex_.
  Side device_{"device"};
  Side ui_{"ui"};
  std::vector<std::string> calls_;
};
