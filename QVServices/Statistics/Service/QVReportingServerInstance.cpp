#include "QVServices/Statistics/Service/QVReportingServerInstance.h"

#include "QVServices/Statistics/QVReportingVocabulary.h"
#include "QVServices/Statistics/Service/QVReportingRunStep.h"
#include "QVServices/Statistics/Service/QVReportingServer.h"
#include "platform/QVPlatform.h"

#include <algorithm>
#include <utility>

namespace {

constexpr uint32_t kTraceCreate = 0x21042814;
constexpr uint32_t kTraceStart = 0x21042818;
constexpr uint32_t kTraceStop = 0x2104281c;
constexpr uint32_t kTraceDestroy = 0x21042820;

// Exit status of a service that a client ended.
constexpr int kKilledStatus = 2;

QVLog& log() {
  return *QVPlatform::shared().log;
}
const QVLogScope* scope() {
  return QVReportingServer::logScope();
}
void mark(uint32_t code) {
  QVPlatform::shared().tracePoints->mark(code);
}
// A step of an operation for that reporter. A client's call is answered whatever its steps throw.
template <class Step>
void run(const QVLogSite& site, std::string_view what, int64_t reporterID, Step&& step) noexcept {
  QVReportingRunStep(scope(), site, what, reporterID, std::forward<Step>(step));
}

}  // namespace

std::shared_ptr<QVReportingServerInstance> QVReportingServerInstance::initWithPID(
    int32_t pid, std::weak_ptr<QVReportingServiceDelegateProtocol> delegate) {
  log().standard(scope(), "-[QVReportingServerInstance initWithPID:delegate:]",
                 "new client with pid ", static_cast<uint64_t>(int64_t{pid}));
  return std::shared_ptr<QVReportingServerInstance>(
      new QVReportingServerInstance(pid, std::move(delegate)));
}

QVReportingServerInstance::QVReportingServerInstance(
    int32_t pid, std::weak_ptr<QVReportingServiceDelegateProtocol> delegate)
    : processIdentifier_(pid), delegate_(std::move(delegate)) {}

QVReportingServerInstance::~QVReportingServerInstance() {
  constexpr const char* kFunction = "-[QVReportingServerInstance dealloc]";
  QVReportingRunStep(scope(), kFunction, "log the end of client", processIdentifier_, [this] {
    log().standard(scope(), kFunction, "dealloc ", processIdentifier_,
                   " from the server client list");
  });
}

std::optional<QVDate> QVReportingServerInstance::clientStartDate() const {
  const std::lock_guard lock(mutex_);
  return clientStartDate_;
}

void QVReportingServerInstance::setClientStartDate(QVDate date) {
  const std::lock_guard lock(mutex_);
  clientStartDate_ = date;
}

std::optional<std::string> QVReportingServerInstance::clientProcessName() const {
  const std::lock_guard lock(mutex_);
  return clientProcessName_;
}

void QVReportingServerInstance::setClientProcessName(std::optional<std::string> name) {
  const std::lock_guard lock(mutex_);
  clientProcessName_ = std::move(name);
}

std::shared_ptr<QVReportingSession> QVReportingServerInstance::findReportingSessionForID(
    int64_t reporterID, bool acrossAllClients) const {
  const auto own = clientReportingSessionMap_.find(reporterID);
  if (own != clientReportingSessionMap_.end()) return own->second;
  if (!acrossAllClients) return nullptr;
  const auto delegate = delegate_.lock();
  return delegate ? delegate->findReportingSessionForID(reporterID) : nullptr;
}

// None where the look-up fails.
std::shared_ptr<QVReportingSession> QVReportingServerInstance::sessionOfAnyClient(
    const QVLogSite& site, int64_t reporterID) const {
  std::shared_ptr<QVReportingSession> found;
  run(site, "find the session of reporter", reporterID,
      [&] { found = findReportingSessionForID(reporterID, true); });
  return found;
}

void QVReportingServerInstance::createReportingSession(int64_t reporterID, Reply<bool> reply) {
  log().verbose(scope(), "-[QVReportingServerInstance createReportingSession:reply:]",
                "creating session for reporter ", reporterID);
  QVReportingServer::queue().async(
      [self = shared_from_this(), reporterID, reply = std::move(reply)]() mutable {
        mark(kTraceCreate);
        self->create(reporterID, reply);
      });
}

void QVReportingServerInstance::create(int64_t reporterID, Reply<bool>& reply) {
  constexpr const char* kFunction = "-[QVReportingServerInstance createReportingSession:reply:]";
  run(kFunction, "create the session of reporter", reporterID, [&] {
    if (clientReportingSessionMap_.size() >= kMaximumSessions &&
        !clientReportingSessionMap_.contains(reporterID)) {
      log().error(scope(), kFunction, "client ", processIdentifier_, " has ", kMaximumSessions,
                  " sessions, none created for reporter ", reporterID);
      return;
    }
    // A session that was there is let go, not stopped.
    clientReportingSessionMap_[reporterID] =
        QVReportingSession::initWithID(reporterID, {processIdentifier_});
    log().standard(scope(), kFunction, "session created for reporter ", reporterID);
  });
  reply(true);
}

void QVReportingServerInstance::setServiceType(uint16_t serviceType, int64_t reportingSession,
                                               Reply<bool> reply) {
  constexpr const char* kFunction =
      "-[QVReportingServerInstance setServiceType:reportingSession:reply:]";
  log().verbose(scope(), kFunction, "setting service type ", serviceType, " for reporter ",
                reportingSession);
  QVReportingServer::queue().async([self = shared_from_this(), serviceType, reportingSession,
                                    reply = std::move(reply)]() mutable {
    if (reportingSession != 0) {
      run(kFunction, "set the service type of reporter", reportingSession, [&] {
        const auto session = self->findReportingSessionForID(reportingSession, false);
        if (session == nullptr) return;
        session->setServiceType(serviceType);
        log().standard(scope(), kFunction, "service type ", serviceType, " set for reporter  ",
                       reportingSession);
      });
    }
    reply(true);
  });
}

void QVReportingServerInstance::getServiceNameForReporterID(int64_t reporterID,
                                                            Reply<uint16_t> reply) {
  log().verbose(scope(), "-[QVReportingServerInstance getServiceNameForReporterID:reply:]",
                "fetching seviceType");
  QVReportingServer::queue().async(
      [self = shared_from_this(), reporterID, reply = std::move(reply)]() mutable {
        self->answerServiceType(reporterID, reply);
      });
}

void QVReportingServerInstance::answerServiceType(int64_t reporterID,
                                                  Reply<uint16_t>& reply) const {
  constexpr const char* kFunction =
      "-[QVReportingServerInstance getServiceNameForReporterID:reply:]";
  // ID 0 is answered at once and, as clients have come to expect, once more below.
  if (reporterID == 0) reply(kQVReportingServiceTypeUnknown);
  const auto session = sessionOfAnyClient(kFunction, reporterID);
  const uint16_t answer = session ? session->serviceType() : kQVReportingServiceTypeUnknown;
  reply(answer);
  log().standard(scope(), kFunction, "returnning service type ", answer, " for reporter  ",
                 reporterID);
}

void QVReportingServerInstance::setConfiguration(QVDictionary configuration, int64_t forReporterID,
                                                 Reply<bool> reply) {
  constexpr const char* kFunction =
      "-[QVReportingServerInstance setConfiguration:forReporterID:reply:]";
  log().verbose(scope(), kFunction, "setting configuration");
  QVReportingServer::queue().async([self = shared_from_this(),
                                    configuration = std::move(configuration), forReporterID,
                                    reply = std::move(reply)]() mutable {
    run(kFunction, "configure the session of reporter", forReporterID, [&] {
      const auto session = self->findReportingSessionForID(forReporterID, false);
      if (session != nullptr) session->setConfiguration(configuration);
    });
    reply(true);
  });
}

void QVReportingServerInstance::startReportingSessionForID(int64_t reporterID, Reply<bool> reply) {
  log().verbose(scope(), "-[QVReportingServerInstance startReportingSessionForID:reply:]",
                "starting session for reporter ", reporterID);
  QVReportingServer::queue().async(
      [self = shared_from_this(), reporterID, reply = std::move(reply)]() mutable {
        mark(kTraceStart);
        self->start(reporterID, std::move(reply));
      });
}

void QVReportingServerInstance::start(int64_t reporterID, Reply<bool> reply) {
  constexpr const char* kFunction =
      "-[QVReportingServerInstance startReportingSessionForID:reply:]";
  const auto session = reporterID == 0 ? nullptr : sessionOfAnyClient(kFunction, reporterID);
  if (session == nullptr || session->started()) {
    reply(true);
    return;
  }
  run(kFunction, "start the session of reporter", reporterID, [&session] { session->start(); });
  run(kFunction, "sample the drivers for reporter", reporterID, [this, &session] {
    if (const auto delegate = delegate_.lock()) session->setDriverSnapShot(delegate->getSnapShot());
  });
  if (auto waiting = std::exchange(session->transactionCompleteBlock(), nullptr)) {
    run(kFunction, "answer the start of reporter", reporterID, [&waiting] { waiting(true); });
  }
  // Answered by the session's next stop, or by a later start that finds it waiting.
  session->setTransactionCompleteBlock(std::move(reply));
}

void QVReportingServerInstance::stopReportingSessionForID(int64_t reporterID, Reply<bool> reply) {
  log().verbose(scope(), "-[QVReportingServerInstance stopReportingSessionForID:reply:]",
                "stopping session for reporter ", reporterID);
  QVReportingServer::queue().async(
      [self = shared_from_this(), reporterID, reply = std::move(reply)]() mutable {
        mark(kTraceStop);
        self->stop(reporterID, reply);
      });
}

void QVReportingServerInstance::stop(int64_t reporterID, Reply<bool>& reply) {
  constexpr const char* kFunction = "-[QVReportingServerInstance stopReportingSessionForID:reply:]";
  if (reporterID == 0) {
    reply(true);
    return;
  }
  if (const auto session = findReportingSessionForID(reporterID, false)) {
    run(kFunction, "send driver statistics of reporter", reporterID,
        [&] { sendDriverStatistics(*session, kFunction); });
    session->setDriverSnapShot(nullptr);
    session->stop();
    if (auto waiting = std::exchange(session->transactionCompleteBlock(), nullptr)) {
      run(kFunction, "answer the start of reporter", reporterID, [&waiting] { waiting(true); });
    }
  }
  run(kFunction, "log the stop of reporter", reporterID,
      [reporterID] { log().standard(scope(), kFunction, "stopping ", reporterID); });
  reply(true);
}

void QVReportingServerInstance::sendDriverStatistics(QVReportingSession& session,
                                                     const QVLogSite& site) const {
  QVDictionary grown;
  if (const auto delegate = delegate_.lock()) {
    grown = delegate->getDriverStatisticsRelativeToSnapShot(session.driverSnapShot());
  }
  if (grown.isAbsent()) {
    log().standard(scope(), site, "nothing interesting to fetch from the drivers");
    return;
  }
  session.sendMessage(grown, kQVReportingCategoryTallying, kQVReportingMessageTypeGeneric, {});
  log().standard(scope(), site, "fetching driver logs ", grown);
}

void QVReportingServerInstance::destroyReportingSession(int64_t reporterID, Reply<bool> reply) {
  log().verbose(scope(), "-[QVReportingServerInstance destroyReportingSession:reply:]",
                "destroying session for reporter ", reporterID);
  QVReportingServer::queue().async(
      [self = shared_from_this(), reporterID, reply = std::move(reply)]() mutable {
        mark(kTraceDestroy);
        self->destroy(reporterID, reply);
      });
}

void QVReportingServerInstance::destroy(int64_t reporterID, Reply<bool>& reply) {
  constexpr const char* kFunction = "-[QVReportingServerInstance destroyReportingSession:reply:]";
  if (reporterID == 0) {
    reply(true);
    return;
  }
  const auto entry = clientReportingSessionMap_.find(reporterID);
  if (entry != clientReportingSessionMap_.end()) {
    if (entry->second->started()) entry->second->stop();
    clientReportingSessionMap_.erase(entry);
  }
  run(kFunction, "log the end of reporter", reporterID,
      [reporterID] { log().standard(scope(), kFunction, "destroying ", reporterID); });
  reply(true);
}

void QVReportingServerInstance::reporterID(int64_t reporterID, Reply<QVDictionary> valid) {
  log().verbose(scope(), "-[QVReportingServerInstance reporterID:valid:]", "validating reporter ",
                reporterID);
  QVReportingServer::queue().async(
      [self = shared_from_this(), reporterID, reply = std::move(valid)]() mutable {
        self->answerValidity(reporterID, reply);
      });
}

void QVReportingServerInstance::answerValidity(int64_t reporterID,
                                               Reply<QVDictionary>& reply) const {
  constexpr const char* kFunction = "-[QVReportingServerInstance reporterID:valid:]";
  const auto session = sessionOfAnyClient(kFunction, reporterID);
  run(kFunction, "log the validation of reporter", reporterID,
      [reporterID] { log().standard(scope(), kFunction, "validating reporter ", reporterID); });
  reply({{"reporterID", session ? reporterID : int64_t{0}},
         {"serviceType", session ? session->serviceType() : kQVReportingServiceTypeUnknown}});
}

void QVReportingServerInstance::getAllReporters(Reply<std::vector<int64_t>> reply) {
  QVReportingServer::queue().async([self = shared_from_this(), reply = std::move(reply)]() mutable {
    self->answerAllReporters(reply);
  });
}

void QVReportingServerInstance::answerAllReporters(Reply<std::vector<int64_t>>& reply) const {
  std::vector<int64_t> reporterIDs;
  run("-[QVReportingServerInstance getAllReporters:]", "list the reporters for client",
      processIdentifier_, [&] {
        const auto delegate = delegate_.lock();
        if (delegate == nullptr) return;
        for (const auto& client : delegate->getAllClients()) {
          for (const auto& [reporterID, session] : client->clientReportingSessionMap()) {
            reporterIDs.push_back(reporterID);
          }
        }
      });
  reply(std::move(reporterIDs));
}

void QVReportingServerInstance::killService([[maybe_unused]] Reply<bool> reply) {
  // The log drops lines while it is full: this one finds room.
  log().flush();
  log().standard(scope(), "-[QVReportingServerInstance killService:]", "DESTROYING SERVICE");
  log().flush();
  QVPlatform::shared().process->exitImmediately(kKilledStatus);
}

void QVReportingServerInstance::handleConnectionError() {
  QVReportingServer::queue().async([self = shared_from_this()] { self->removeFromService(); });
}

void QVReportingServerInstance::removeFromService() {
  const auto delegate = delegate_.lock();
  if (delegate == nullptr) return;
  const auto& clients = delegate->getAllClients();
  const auto isThis = [this](const auto& client) { return client.get() == this; };
  if (std::ranges::none_of(clients, isThis)) return;
  for (const auto& [reporterID, session] : clientReportingSessionMap_) {
    if (session->started()) session->stop();
  }
  delegate->removeClient(*this);
  log().standard(scope(), "-[QVReportingServerInstance handleConnectionError]", "removing ",
                 processIdentifier_, " from the server client list");
}
