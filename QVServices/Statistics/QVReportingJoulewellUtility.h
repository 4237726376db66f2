#pragma once

#include "QVServices/Statistics/QVReportingSessionInformation.h"
#include "platform/QVValue.h"

#include <cstdint>

// Turns a message that tells how long a haptic engine ran into an event of the power-logging
// service. No state; called on the server queue.
class QVReportingJoulewellUtility {
 public:
  static constexpr int32_t kAgent = 28;
  static constexpr const char* kEventName = "Vidra_Haptics";

  // Logs one event if the message has "EngineOnTime", whatever its category and type; else does
  // nothing. A missing application name or timestamp costs that entry and an error line.
  static void handleEvent(const QVDictionary& message, uint32_t withCategory, uint16_t type,
                          const QVReportingSessionInformation& session);
};
