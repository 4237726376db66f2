#include "client/QVReporterCalls.h"

#include "client/QVClientBatch.h"
#include "client/QVReporterConfiguration.h"

#include <algorithm>
#include <utility>

namespace {

// What may be under way, not answered yet, and would be lost with the connection: calls, and bytes
// of messages. Enough to keep the service busy while answers travel.
constexpr uint64_t kMaximumUnderWay = 256;
constexpr std::size_t kMaximumBytesUnderWay = std::size_t{256} << 10;

// Sessions that are looked up in one go to be restored; more than there are calls to make.
constexpr std::size_t kRestoredAtOnce = 256;

// What the queue and each real-time queue get done in a turn: none of them, however full, keeps the
// others from what room there is.
constexpr std::size_t kTurn = 32;

using Kind = QVReporterRecord::Kind;

QVDropReason reasonOf(const QVClientError& error) {
  switch (error.code()) {
    case QVClientError::Code::connectionLost:
    case QVClientError::Code::closed:
      return QVDropReason::connectionLost;
    case QVClientError::Code::serviceError:
      return error.domain() == kQVClientReportingDomain &&
                     error.serviceCode() == kQVClientReportingSwitchedOff
                 ? QVDropReason::disabled
                 : QVDropReason::refused;
    default:
      return QVDropReason::refused;
  }
}

}  // namespace

void QVReporterCalls::begin(QVClient& client) {
  client_ = &client;
  isLost_ = false;
  isAnswered_ = false;
  isRestored_ = !core_.options.restoreSessions;
  restoredUpTo_.reset();
}

void QVReporterCalls::end() {
  client_ = nullptr;
  isLost_ = false;
  isRestored_ = true;
  // Answers that did not run, for want of memory.
  core_.countDrop(QVDropReason::connectionLost, std::exchange(messagesUnderWay_, 0));
  bytesUnderWay_ = 0;
  answered_ = issued_;
  const bool forgets = !core_.options.restoreSessions;
  if (forgets) {
    core_.rings.forEach([this](QVRealtimeRing& ring) {
      if (ring.session->isPresent) lose(ring);
    });
  }
  core_.sessions.forEach([forgets](QVReporterSessionState& session) {
    session.isPresent = false;
    if (forgets) session.isStarted = false;
    return true;
  });
}

bool QVReporterCalls::hasRoom() const {
  return client_ != nullptr && !isLost_ && issued_ - answered_ < kMaximumUnderWay &&
         bytesUnderWay_ < kMaximumBytesUnderWay;
}

bool QVReporterCalls::wantsConnection() {
  QVReporterRecord record;
  if (core_.queue.front(record)) return true;
  if (!core_.options.restoreSessions) return false;
  bool hasSessions = false;
  core_.sessions.forEach([&hasSessions](const QVReporterSessionState& session) {
    hasSessions = session.isOpen;
    return !hasSessions;
  });
  return hasSessions;
}

bool QVReporterCalls::isDone() {
  QVReporterRecord record;
  return !core_.queue.front(record) && issued_ == answered_ && areRingsWorkedOff();
}

void QVReporterCalls::work() {
  std::optional<QVClientBatch> batch;
  if (client_ != nullptr) batch.emplace(*client_);
  if (!isRestored_) isRestored_ = restore();
  const QVRealtimeRings::List rings = core_.rings.all();
  const std::size_t takers = 1 + rings.size();
  // Until all of them in a row had nothing to do, or no room. The next time goes on with whose turn
  // it then is.
  for (std::size_t idle = 0; idle < takers; ++turn_) {
    turn_ %= takers;
    const std::size_t done = turn_ == 0 ? workQueue() : workRing(*rings[turn_ - 1]);
    idle = done == 0 ? idle + 1 : 0;
  }
  polls_ = std::ranges::any_of(
      rings, [](const auto& ring) { return hasSession(*ring) && ring->session->isStarted; });
  core_.rings.removeOver();
}

std::size_t QVReporterCalls::workQueue() {
  if (!isRestored_) return 0;
  std::size_t done = 0;
  for (QVReporterRecord record; done < kTurn && core_.queue.front(record); ++done) {
    const bool isHandled = record.kind == Kind::message
                               ? handleMessage(record, core_.queue.frontPayload())
                               : handleStep(record, *record.session);
    if (!isHandled) break;
    core_.queue.pop();
  }
  return done;
}

bool QVReporterCalls::restore() {
  for (;;) {
    const auto sessions = core_.sessions.openAbove(restoredUpTo_, kRestoredAtOnce);
    for (QVReporterSessionState* session : sessions) {
      if (!session->isPresent && !make(*session)) return false;
      restoredUpTo_ = session->reporterID;
    }
    if (sessions.size() < kRestoredAtOnce) return true;
  }
}

// False where a call cannot be made, now or on this connection.
bool QVReporterCalls::make(QVReporterSessionState& session) {
  if (!hasRoom()) return false;
  const int64_t reporterID = session.reporterID;
  session.isPresent =
      issue(client_->createReportingSession(reporterID, acknowledge())) &&
      issue(client_->setServiceType(session.serviceType, reporterID, acknowledge())) &&
      (session.configuration.empty() || configure(session)) &&
      (!session.isStarted || start(session));
  return session.isPresent;
}

bool QVReporterCalls::configure(QVReporterSessionState& session) {
  view_.use(session.configuration, session.configuration.size());
  return issue(client_->setConfiguration(view_, session.reporterID, acknowledge()));
}

bool QVReporterCalls::start(QVReporterSessionState& session) {
  // A start is answered when the session stops. The question behind it is answered when the service
  // has started the session.
  if (client_->startReportingSessionForID(session.reporterID, nullptr)) {
    isLost_ = true;
    return false;
  }
  return issue(client_->reporterIDValid(
      session.reporterID,
      [this](const QVClientResult<QVClientReporter>& reporter) { take(reporter.error(), 0); }));
}

bool QVReporterCalls::issue(const QVClientError& error) {
  // There is room, so that only a loss or the lack of memory keeps a call back. Then the sessions
  // are made up for on another connection.
  if (error) {
    isLost_ = true;
    return false;
  }
  ++issued_;
  return true;
}

QVClientBooleanReply QVReporterCalls::acknowledge() {
  return [this](const QVClientResult<bool>& handled) { take(handled.error(), 0); };
}

void QVReporterCalls::take(const QVClientError& error, std::size_t bytes) {
  ++answered_;
  bytesUnderWay_ -= bytes;
  isAnswered_ = isAnswered_ || !error;
}

// Was it lost with an earlier connection, and is not to be restored?
bool QVReporterCalls::isGone(const QVReporterSessionState& session) const {
  return !session.isPresent && !core_.options.restoreSessions;
}

// False where it has to wait and so stays where it is, as in all that follow.
bool QVReporterCalls::handleMessage(const QVReporterRecord& record, std::span<char> payload) {
  if (core_.isReportingOff()) {
    core_.countDrop(QVDropReason::disabled);
    return true;
  }
  if (record.session != nullptr && isGone(*record.session)) {
    core_.countDrop(QVDropReason::connectionLost);
    return true;
  }
  if (!isRestored_ || !hasRoom()) return false;
  const std::size_t bytes = payload.size();
  const auto count = [this, bytes](const QVClientError& error) {
    take(error, bytes);
    --messagesUnderWay_;
    if (error) {
      core_.countDrop(reasonOf(error));
    } else {
      core_.ledger.countSent();
    }
  };
  view_.use(payload, bytes);
  const QVClientError error = client_->sendMessage(
      view_, QVClientCategory(record.category), static_cast<QVClientMessageType>(record.type),
      record.session != nullptr ? QVClientTargets(record.session->reporterID)
                                : QVClientTargets::everySession(),
      count);
  if (error.code() == QVClientError::Code::messageTooLarge) {
    core_.countDrop(QVDropReason::invalid);
    return true;
  }
  if (!issue(error)) return false;
  bytesUnderWay_ += bytes;
  ++messagesUnderWay_;
  return true;
}

bool QVReporterCalls::handleStep(const QVReporterRecord& record, QVReporterSessionState& session) {
  if (record.kind == Kind::destroy) return destroy(session);
  const bool makes = record.kind == Kind::open || record.kind == Kind::start;
  if (!hasRoom() && (makes || !isGone(session))) return false;
  if (record.kind == Kind::stop && !isDrainedBeforeStep(session)) return false;
  switch (record.kind) {
    case Kind::open:
      session.serviceType = static_cast<QVClientServiceType>(record.type);
      session.isOpen = make(session);
      return session.isOpen;
    case Kind::setServiceType:
      session.serviceType = static_cast<QVClientServiceType>(record.type);
      return !session.isPresent ||
             issue(client_->setServiceType(session.serviceType, session.reporterID, acknowledge()));
    case Kind::setConfiguration: {
      std::string merged = QVReporterMergedConfiguration(session.configuration, record.payload);
      // Then the last addition has to do for the session's restoration.
      if (merged.size() > kQVReporterMaximumConfigurationBytes) merged = record.payload;
      session.configuration = std::move(merged);
      return !session.isPresent || configure(session);
    }
    case Kind::start:
      // It was lost when its start had been asked for already.
      core_.rings.admitMessages(session);
      session.isStarted = true;
      return session.isPresent ? start(session) : make(session);
    case Kind::stop:
      session.isStarted = false;
      return !session.isPresent ||
             issue(client_->stopReportingSessionForID(session.reporterID, acknowledge()));
    case Kind::message:
    case Kind::destroy:
      break;
  }
  return true;
}

bool QVReporterCalls::destroy(QVReporterSessionState& session) {
  // One that was lost and is to be restored waits for that, where its real-time queues hold
  // something.
  if ((session.isPresent || session.isStarted) && !isDrainedBeforeStep(session)) return false;
  if (session.isPresent &&
      (!hasRoom() || !issue(client_->destroyReportingSession(session.reporterID, acknowledge())))) {
    return false;
  }
  for (const auto& ring : core_.rings.all()) {
    if (ring->session != &session) continue;
    drop(*ring);
    core_.rings.remove(*ring);
  }
  core_.sessions.remove(session);
  return true;
}

// Real-time queues.

// False where something is left of what was committed before the step at the queue's front: it is
// worked off in the real-time queues' own turns. What is committed from then on does not hold the
// step up.
bool QVReporterCalls::isDrainedBeforeStep(const QVReporterSessionState& session) {
  const bool marks = std::exchange(markedStep_, core_.queue.consumed()) != core_.queue.consumed();
  bool isDrained = true;
  core_.rings.forEach([&session, &isDrained, marks](QVRealtimeRing& ring) {
    if (ring.session != &session) return;
    if (marks) ring.writtenBeforeStep = ring.written();
    isDrained = isDrained && ring.taken() >= ring.writtenBeforeStep;
  });
  return isDrained;
}

// Rings that are over may have left the list of all of them before their session was destroyed.
bool QVReporterCalls::hasSession(const QVRealtimeRing& ring) {
  return !ring.isOver() && ring.session != nullptr;
}

std::size_t QVReporterCalls::workRing(QVRealtimeRing& ring) {
  if (!hasSession(ring)) return 0;
  const uint64_t last = ring.session->isStarted ? ring.written() : ring.writtenBeforeStep;
  std::size_t done = 0;
  for (QVRealtimeRing::Message message;
       done < kTurn && ring.taken() < last && ring.front(message) &&
       handleMessage({.type = message.type, .category = message.category, .session = ring.session},
                     message.payload);
       ++done) {
    ring.pop();
  }
  return done;
}

// What is in it is lost, and what comes is refused. Needs no memory, as the next.
void QVReporterCalls::lose(QVRealtimeRing& ring) {
  ring.refuse();
  QVRealtimeRing::Message message;
  for (; ring.front(message); ring.pop()) core_.countDrop(QVDropReason::connectionLost);
}

// The same for good.
void QVReporterCalls::drop(QVRealtimeRing& ring) {
  ring.close();
  ring.session = nullptr;
  lose(ring);
}

void QVReporterCalls::markRings() {
  core_.rings.forEach([](QVRealtimeRing& ring) { ring.writtenBeforeFlush = ring.written(); });
}

bool QVReporterCalls::areRingsWorkedOff() {
  bool are = true;
  core_.rings.forEach([&are](const QVRealtimeRing& ring) {
    are = are && (!ring.session->isStarted || ring.taken() >= ring.writtenBeforeFlush);
  });
  return are;
}

void QVReporterCalls::abandon() {
  for (QVReporterRecord record; core_.queue.front(record); core_.queue.pop()) {
    if (record.kind == Kind::message) core_.countDrop(QVDropReason::connectionLost);
  }
  for (const auto& ring : core_.rings.close()) drop(*ring);
}
