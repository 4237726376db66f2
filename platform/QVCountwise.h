#pragma once

#include "platform/QVFunction.h"
#include "platform/QVValue.h"

#include <string>

// Countwise, the analytics event service.
//
// Threads: any, at once; never blocks, never fails visibly.
class QVCountwise {
 public:
  using PayloadCallback = QVFunction<QVDictionary()>;

  virtual ~QVCountwise() = default;
  // Sends an event, lazily: the callback is called at most once, only if the service wants the
  // event, later, on a thread of the service, or before this returns where the service has none. It
  // owns what it captures.
  virtual void sendEventLazily(std::string name, PayloadCallback payload) = 0;
};
