#pragma once

#include "platform/QVLog.h"
#include "platform/QVWorkQueue.h"

#include <memory>

// Process-wide state of the service host: the server queue, on which every operation of every
// client runs, and the log scope "qvrs". Written by QVReportingServiceDelegate's creation, before
// any client is served; only read after it, by any thread.
class QVReportingServer {
 public:
  static void setQueue(std::shared_ptr<QVWorkQueue> queue);
  static QVWorkQueue& queue();
  // The same, for whoever keeps it.
  static const std::shared_ptr<QVWorkQueue>& sharedQueue();

  static void setLogScope(const QVLogScope* scope);
  // Null, which is the default log, until it is registered.
  static const QVLogScope* logScope();
};
