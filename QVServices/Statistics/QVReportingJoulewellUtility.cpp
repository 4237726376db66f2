#include "QVServices/Statistics/QVReportingJoulewellUtility.h"

#include "QVServices/Statistics/QVReportingVocabulary.h"
#include "platform/QVPlatform.h"

#include <vector>

void QVReportingJoulewellUtility::handleEvent(const QVDictionary& message,
                                              [[maybe_unused]] uint32_t withCategory,
                                              [[maybe_unused]] uint16_t type,
                                              const QVReportingSessionInformation& session) {
  constexpr const char* kFunction =
      "+[QVReportingJoulewellUtility handleEvent:withCategory:type:session:]";
  const QVValue* engineOnTime = message.find("EngineOnTime");
  if (engineOnTime == nullptr) return;

  QVLog& log = *QVPlatform::shared().log;
  std::vector<QVDictionaryEntry> event{{"EngineOnDuration", *engineOnTime}};
  QVValue applicationName = QVReportingHostApplicationID(session.userInfo());
  if (applicationName.isAbsent()) {
    log.error(nullptr, kFunction, "failed to get app name for joulewell");
  } else {
    event.push_back({"ApplicationName", std::move(applicationName)});
  }
  if (const QVValue* timestamp = message.find("qvreporting_timestamp")) {
    event.push_back({"TimestampEnd", *timestamp});
  } else {
    log.error(nullptr, kFunction, "failed to get QVReporting timestamp for joulewell");
  }
  QVPlatform::shared().joulewell->logEvent(kAgent, kEventName, QVDictionary::assemble(event), {});
}
