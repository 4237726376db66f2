#pragma once

#include "platform/QVValue.h"

// What the event sinks need to know of a session. Implemented by QVReportingSession.
class QVReportingSessionInformation {
 public:
  virtual ~QVReportingSessionInformation() = default;
  // The session's user information as it is now. Any thread.
  virtual QVDictionary userInfo() const = 0;
};
