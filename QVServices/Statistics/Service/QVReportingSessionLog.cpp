#include "QVServices/Statistics/Service/QVReportingSessionLog.h"

QVOncePerPlatform<QVLogScope*>& QVReportingSessionLog::registered() {
  static QVOncePerPlatform<QVLogScope*> scope;
  return scope;
}

void QVReportingSessionLog::registerScope() {
  registered().get([] {
    return QVPlatform::shared().log->registerScope(true, 0x71767272, "qvrr", "net.quillon.quietvox",
                                                   "reporting_session_verbose", 31);
  });
}

const QVLogScope* QVReportingSessionLog::scope() {
  return registered().peek();
}
