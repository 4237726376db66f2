#pragma once

#include "platform/QVError.h"

#include <string>

// Errors that the event store gives to Beacon's callers.
inline constexpr const char* kBeaconErrorDomain = "net.quillon.beacon";

enum class QVEventStoreErrorCode : int64_t {
  closed = 1,       // the service is ending
  unavailable = 2,  // the store could not be opened
  outOfOrder = 3    // the store could not be written; what was sent is kept and tried again
};

inline QVError QVMakeEventStoreError(QVEventStoreErrorCode code, const std::string& reason) {
  return {.domain = kBeaconErrorDomain,
          .code = static_cast<int64_t>(code),
          .userInfo = {{QVError::kFailureReason, reason}}};
}

inline QVError QVEventStoreClosedError() {
  return QVMakeEventStoreError(QVEventStoreErrorCode::closed, "the event store is closed");
}
