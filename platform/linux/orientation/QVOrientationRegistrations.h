#pragma once

#include "platform/QVFunction.h"
#include "platform/QVLog.h"
#include "platform/QVOrientation.h"
#include "platform/linux/QVThreadAnnotations.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

// Who wants to be told of one orientation (the device's or the user interface's), and the last
// value known of it.
//
// There is demand while anybody is registered; each time it begins, the period has a number of its
// own. What changes are told from is known at once where there is a `baseline`, which is asked by
// the registration that begins the period: whatever changes after that is told, and nothing from
// before. Where there is none, it is the first value reported in the period, of which nobody is
// told. Later registrations share what is known.
//
// Used by QVLinuxOrientation. Threads: any; report() on the orientation's thread alone. Callbacks
// are called and destroyed without a lock. The baseline is asked on the registering thread, under
// the lock, so that others who register meanwhile find it known: it must not wait, nor come back
// here. The log outlives it.
// Failures: an exception of a callback is one error line; the others are called all the same. What
// comes above kMaximumRegistrations is dropped, with one error line until one has been free again.
class QVOrientationRegistrations {
 public:
  using Period = uint64_t;
  // What the source says now.
  using Baseline = QVFunction<int32_t()>;
  static constexpr Period kNoDemand = 0;
  // Each holds a session, some hundred bytes and more, for as long as its owner does not end it,
  // and every change is told to all. So many sessions at once are far more than a machine's
  // applications have.
  static constexpr std::size_t kMaximumRegistrations = 16'384;

  explicit QVOrientationRegistrations(QVLog& log, Baseline baseline = nullptr)
      : log_(log), baseline_(std::move(baseline)) {}

  void add(std::string_view callbackID, QVOrientation::Callback callback);
  // The oldest of the ID.
  void remove(std::string_view callbackID);

  Period period() const;
  // The value as the source knows it; a change is told to all who are registered, in the order of
  // registration. Ignored where the period is over.
  void report(Period period, int32_t orientation);

 private:
  struct Registration;

  QVLog& log_;
  mutable QVMutex mutex_;
  Baseline baseline_ QV_GUARDED_BY(mutex_);
  std::vector<std::shared_ptr<Registration>> registrations_ QV_GUARDED_BY(mutex_);
  bool hasDropped_ QV_GUARDED_BY(mutex_) = false;  // since one was free
  Period lastPeriod_ QV_GUARDED_BY(mutex_) = kNoDemand;
  std::optional<int32_t> known_ QV_GUARDED_BY(mutex_);
};
