#include "tests/support/QVServiceFixture.h"

#include "platform/QVText.h"

QVReportingServiceDelegate& QVServiceFixture::service() {
  if (service_ == nullptr) {
    startService();
    journal_.forget();
  }
  return *service_;
}

void QVServiceFixture::startService() {
  service_ = QVReportingServiceDelegate::init();
  platform_.listener().setDelegate(service_);
}

void QVServiceFixture::switchReporting(bool enabled) {
  service();
  platform_.preferences().setValue(kPreferencesDomain, "disable_reporting", !enabled);
  postDefaultsNotification();
  runServerQueue();
  journal_.forget();
}

QVTestClient& QVServiceFixture::connectClient(int32_t pid) {
  service();
  return clients_.emplace_back(platform_.listener().connect(pid), journal_);
}

QVTestClient& QVServiceFixture::registeredClient(int32_t pid) {
  QVTestClient& client = connectClient(pid);
  runUntilIdle();
  journal_.forget();
  return client;
}

QVTestClient& QVServiceFixture::clientWithSession(int32_t pid, int64_t reporterID,
                                                  uint16_t serviceType) {
  QVTestClient& client = connectClient(pid);
  client.create(reporterID);
  client.setServiceType(serviceType, reporterID);
  runUntilIdle();
  journal_.forget();
  return client;
}

QVTestClient& QVServiceFixture::clientWithStartedSession(int32_t pid, int64_t reporterID,
                                                         uint16_t serviceType) {
  QVTestClient& client = clientWithSession(pid, reporterID, serviceType);
  client.start(reporterID);
  runUntilIdle();
  journal_.forget();
  return client;
}

std::vector<std::string> QVServiceFixture::takeBeaconStory() {
  using Kind = QVFakeBeaconEvent::Kind;
  std::vector<std::string> story;
  for (const QVFakeBeaconEvent& event : platform_.beacon().events()) {
    const auto content = [&event] {
      return QVText(": ", event.category, '/', event.type, ' ', event.payload);
    };
    switch (event.kind) {
      case Kind::session:
        story.push_back(QVText("session ", event.session));
        break;
      case Kind::configuration:
        story.push_back(QVText("configuration ", event.session));
        break;
      case Kind::message:
        story.push_back(QVText(event.accepted ? "message " : "refused ", event.session, content()));
        break;
      case Kind::singleMessage:
        story.push_back(QVText(event.accepted ? "single" : "refused single", content()));
        break;
      case Kind::flush:
        story.push_back(QVText(event.accepted ? "flush " : "failed flush ", event.session));
        break;
      case Kind::sessionEnd:
        story.push_back(QVText("end ", event.session));
        break;
    }
  }
  platform_.beacon().forgetEvents();
  return story;
}

QVFakeBeaconEvent QVServiceFixture::latestBeaconEvent(QVFakeBeaconEvent::Kind kind) {
  const auto events = platform_.beacon().events(kind);
  return events.empty() ? QVFakeBeaconEvent{} : events.back();
}

std::string hostLine(QVLogLevel level, std::string_view operation, std::string_view text) {
  return logEntry(level, "qvrs", QVText("-[QVReportingServiceDelegate ", operation, ']'), text);
}

std::string clientLine(QVLogLevel level, std::string_view operation, std::string_view text) {
  return logEntry(level, "qvrs", QVText("-[QVReportingServerInstance ", operation, ']'), text);
}

std::string sessionLine(QVLogLevel level, std::string_view operation, std::string_view text) {
  return logEntry(level, "qvrr", QVText("-[QVReportingSession ", operation, ']'), text);
}

std::string driverLine(QVLogLevel level, std::string_view operation, std::string_view text) {
  return logEntry(level, "qvrd", QVText("-[QVReportingDriverUtility ", operation, ']'), text);
}

std::string lookupHit(int64_t reporterID, int32_t pid) {
  return hostLine(QVLogLevel::info, "findReportingSessionForID:",
                  QVText("found reporting session ", reporterID, " for client ", pid));
}

std::string lookupFailure(int64_t reporterID) {
  return hostLine(QVLogLevel::error, "findReportingSessionForID:",
                  QVText("failed to find reporting session ", reporterID));
}

std::string singleLine(QVLogLevel level, std::string_view text, std::string_view scope) {
  return logEntry(
      level, scope,
      "+[QVReportingSession sendSingleMessage:category:type:serviceType:userInfo:reply:]", text);
}

std::string waitLine(QVLogLevel level, std::string_view text) {
  return logEntry(level, "qvrr", "QVReportingUtilityWait", text);
}
