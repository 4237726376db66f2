// How a QVReportingServerInstance routes a client's message to sessions and event sinks.

#include "QVServices/Statistics/QVReportingCountwiseBridge.h"
#include "QVServices/Statistics/QVReportingJoulewellUtility.h"
#include "QVServices/Statistics/QVReportingVocabulary.h"
#include "QVServices/Statistics/Service/QVReportingPayloads.h"
#include "QVServices/Statistics/Service/QVReportingRunStep.h"
#include "QVServices/Statistics/Service/QVReportingServer.h"
#include "QVServices/Statistics/Service/QVReportingServerInstance.h"
#include "platform/QVPlatform.h"

#include <utility>

namespace {

constexpr uint32_t kTraceRouted = 0x21042824;

constexpr const char* kFunction =
    "-[QVReportingServerInstance sendMessage:withCategory:andType:forReportingIDs:reply:]";

using Sessions = std::vector<std::shared_ptr<QVReportingSession>>;

QVLog& log() {
  return *QVPlatform::shared().log;
}
const QVLogScope* scope() {
  return QVReportingServer::logScope();
}

// "[1,2]", or "(null)" where the client listed none; no longer than the log takes.
std::string textOf(const QVReportingServiceProtocol::ReporterIDs& reporterIDs) {
  if (!reporterIDs) return "(null)";
  std::string text = "[";
  for (const int64_t reporterID : *reporterIDs) {
    if (text.size() > QVLog::kMaximumTextBytes) break;
    if (text.size() > 1) text += ',';
    QVAppendText(text, reporterID);
  }
  return text += ']';
}

// No longer than the log takes: this is made for every broadcast message.
std::string textOf(const Sessions& sessions) {
  std::string text = "[";
  for (const auto& session : sessions) {
    if (text.size() > QVLog::kMaximumTextBytes) break;
    if (text.size() > 1) text += ',';
    text += session->description();
  }
  return text += ']';
}

// What one of the message's ways throws keeps it from none of the others.
template <class Step>
void run(std::string_view what, int64_t number, Step&& step) noexcept {
  QVReportingRunStep(scope(), kFunction, what, number, std::forward<Step>(step));
}

void handToSinks(const QVDictionary& message, uint32_t category, uint16_t type,
                 const QVReportingSession& session) {
  run("make an analytics event for reporter", session.reporterID(),
      [&] { QVReportingCountwiseBridge::handleEvent(message, category, type, session); });
  run("make a power-log event for reporter", session.reporterID(),
      [&] { QVReportingJoulewellUtility::handleEvent(message, category, type, session); });
}

void sendTo(QVReportingSession& session, const QVDictionary& message, const QVDictionary& payload,
            uint32_t category, uint16_t type) {
  run("send a message of reporter", session.reporterID(),
      [&] { session.sendMessage(message, payload, category, type); });
}

}  // namespace

void QVReportingServerInstance::sendMessage(QVDictionary message, uint32_t withCategory,
                                            uint16_t andType, ReporterIDs forReportingIDs,
                                            Reply<std::optional<QVError>> reply) {
  if (QVLog::logEnabled(QVLog::kVerbose, scope())) {
    log().verbose(scope(), kFunction, "sending message for reporter ", textOf(forReportingIDs));
  }
  QVReportingServer::queue().async([self = shared_from_this(), message = std::move(message),
                                    withCategory, andType, reporterIDs = std::move(forReportingIDs),
                                    reply = std::move(reply)]() mutable {
    self->route(message, withCategory, andType, reporterIDs, reply);
  });
}

void QVReportingServerInstance::route(const QVDictionary& message, uint32_t category, uint16_t type,
                                      const ReporterIDs& reporterIDs,
                                      Reply<std::optional<QVError>>& reply) const {
  QVPlatform::shared().tracePoints->mark(kTraceRouted);
  const auto delegate = delegate_.lock();
  if (delegate == nullptr || !delegate->isReportingEnabled()) {
    reply(QVError{kQVReportingErrorDomain, kQVReportingErrorSwitchedOff, {}});
    return;
  }
  run("route a message of client", processIdentifier_, [&] {
    if (reporterIDs) {
      routeToListed(message, category, type, *reporterIDs);
    } else {
      routeToAllStarted(message, category, type, *delegate);
    }
  });
  reply(std::nullopt);
}

void QVReportingServerInstance::routeToListed(const QVDictionary& message, uint32_t category,
                                              uint16_t type,
                                              const std::vector<int64_t>& reporterIDs) const {
  const QVDictionary payload = QVReportingNormalisedPayload(message);
  for (const int64_t reporterID : reporterIDs) {
    if (reporterID == 0) continue;
    run("find the session of reporter", reporterID, [&] {
      const auto session = findReportingSessionForID(reporterID, true);
      if (session == nullptr) return;
      // Here the sinks come first, on the broadcast path the session does; readers of the event
      // stores rely on both orders.
      handToSinks(message, category, type, *session);
      sendTo(*session, message, payload, category, type);
    });
  }
}

void QVReportingServerInstance::routeToAllStarted(
    const QVDictionary& message, uint32_t category, uint16_t type,
    const QVReportingServiceDelegateProtocol& delegate) const {
  Sessions active;
  for (const auto& client : delegate.getAllClients()) {
    Sessions all;
    for (const auto& [reporterID, session] : client->clientReportingSessionMap()) {
      all.push_back(session);
      if (session->started()) active.push_back(session);
    }
    run("log the sessions of client", client->processIdentifier(), [&] {
      log().standard(scope(), kFunction, "sessions for client ", client->processIdentifier(), " : ",
                     textOf(all));
    });
  }
  run("log the active sessions for client", processIdentifier_, [&active] {
    log().standard(scope(), kFunction, "active reporting sessions ", active.size(), " : ",
                   textOf(active));
  });
  if (active.empty()) {
    run("log a message of no session of client", processIdentifier_, [] {
      log().standard(scope(), kFunction,
                     "no active reporting sessions found, sending as standalone");
    });
    QVReportingSession::sendSingleMessage(
        message, category, type, kQVReportingServiceTypeStandalone, delegate.getDefaults(), {});
    return;
  }
  const QVDictionary payload = QVReportingNormalisedPayload(message);
  for (const auto& session : active) {
    sendTo(*session, message, payload, category, type);
    handToSinks(message, category, type, *session);
  }
}
