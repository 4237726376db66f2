#include "QVServices/Statistics/Service/QVReportingServiceMain.h"

#include "QVServices/Statistics/Service/QVReportingServiceDelegate.h"
#include "platform/QVPlatform.h"

int QVReportingServiceMain() {
  const auto delegate = QVReportingServiceDelegate::init();
  QVIPCListener& listener = *QVPlatform::shared().listener;
  listener.setDelegate(delegate);
  listener.resume();
  return 0;
}
