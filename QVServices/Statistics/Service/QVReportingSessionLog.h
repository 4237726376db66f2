#pragma once

#include "platform/QVPlatform.h"

// The log scope "qvrr" that all sessions of the process share.
class QVReportingSessionLog {
 public:
  // Registers the scope with the first session of the process.
  static void registerScope();
  // Null, which is the default log, until then. Any thread.
  static const QVLogScope* scope();

 private:
  static QVOncePerPlatform<QVLogScope*>& registered();
};
