#include "QVServices/Statistics/QVReportingCountwiseBridge.h"

#include "QVServices/Statistics/QVReportingVocabulary.h"
#include "platform/QVPlatform.h"
#include "platform/QVText.h"

void QVReportingCountwiseBridge::handleEvent(const QVDictionary& message, uint32_t withCategory,
                                             uint16_t type,
                                             const QVReportingSessionInformation& session) {
  // Message and user information are immutable, so holding them is as good as a copy made now.
  QVPlatform::shared().countwise->sendEventLazily(
      QVText(kEventNamePrefix, QVReportingCategoryName(withCategory), '.',
             QVReportingMessageTypeName(type)),
      [message, userInfo = session.userInfo()] {
        return message.merging(
            {{kQVReportingHostApplicationKey, QVReportingHostApplicationID(userInfo)}},
            message.charge());
      });
}
