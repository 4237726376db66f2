#pragma once

#include "QVServices/Statistics/QVReportingSessionInformation.h"
#include "platform/QVValue.h"

#include <cstdint>

// Forwards client messages to the analytics event service: each call sends one event. No state;
// called on the server queue.
class QVReportingCountwiseBridge {
 public:
  static constexpr const char* kEventNamePrefix = "net.quillon.quietvox.";

  // Sends the event "net.quillon.quietvox.CATEGORY.TYPE" with the message's entries and, over
  // them, the session's application name. The event's payload is made only if the service wants
  // it, on the service's thread, of what the session is now; the client's message stays as it is.
  static void handleEvent(const QVDictionary& message, uint32_t withCategory, uint16_t type,
                          const QVReportingSessionInformation& session);
};
