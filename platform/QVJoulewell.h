#pragma once

#include "platform/QVValue.h"

#include <cstdint>
#include <string_view>

// Joulewell, the power-logging service.
//
// Threads: any, at once; never blocks, never fails visibly.
class QVJoulewell {
 public:
  virtual ~QVJoulewell() = default;
  // Logs a registered event of an agent.
  virtual void logEvent(int32_t agent, std::string_view name, const QVDictionary& event,
                        const QVDictionary& options) = 0;
};
