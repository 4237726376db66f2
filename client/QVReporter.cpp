#include "client/QVReporter.h"

#include "client/QVReporterCore.h"
#include "client/QVReporterWorker.h"

#include <algorithm>
#include <new>
#include <thread>
#include <utility>

namespace {

using Code = QVClientError::Code;

// Of a queue's bytes and messages, and of a duration: what keeps sums from overflowing.
constexpr std::size_t kMaximumQueuedBytes = std::size_t{1} << 30;
constexpr std::size_t kMaximumQueuedMessages = std::size_t{1} << 24;
constexpr std::chrono::milliseconds kShortest{1};
constexpr std::chrono::milliseconds kLongest = std::chrono::hours(24);

bool isWithin(std::chrono::milliseconds duration, std::chrono::milliseconds least) {
  return duration >= least && duration <= kLongest;
}

bool areInOrder(const QVReporterOptions& options) {
  return options.maximumQueuedBytes != 0 && options.maximumQueuedBytes <= kMaximumQueuedBytes &&
         options.maximumQueuedMessages != 0 &&
         options.maximumQueuedMessages <= kMaximumQueuedMessages &&
         isWithin(options.shortestReconnectDelay, kShortest) &&
         isWithin(options.longestReconnectDelay, options.shortestReconnectDelay) &&
         isWithin(options.endTimeLimit, std::chrono::milliseconds::zero()) &&
         isWithin(options.realtimePeriod, kShortest) &&
         isWithin(options.dropReportInterval, std::chrono::milliseconds::zero());
}

}  // namespace

QVReporter::QVReporter(std::shared_ptr<QVReporterCore> core) : core_(std::move(core)) {}

QVClientResult<std::unique_ptr<QVReporter>> QVReporter::open(QVReporterOptions options) {
  if (!areInOrder(options)) {
    return QVClientError(Code::invalidArgument, "an option of the reporter is out of its limits");
  }
  try {
    auto core = std::make_shared<QVReporterCore>(std::move(options));
    if (!core->bell.isOpen()) {
      return QVClientError(Code::cannotConnect, "no descriptors left for the reporter");
    }
    std::unique_ptr<QVReporter> reporter(new QVReporter(core));
    const QVClientError error = core->thread.start([core] {
      core->threadID = std::this_thread::get_id();
      QVReporterWorker(*core).run();
      // The system may give the same ID to a thread of the program's.
      core->threadID = std::thread::id();
    });
    if (error) return error;
    return reporter;
  } catch (const std::bad_alloc&) {
    return QVClientError(Code::outOfMemory, QVClientError::textOf(Code::outOfMemory));
  }
}

QVReporter::~QVReporter() {
  core_->queue.close();
  const bool inCallback = core_->threadID.load() == std::this_thread::get_id();
  const auto now = std::chrono::steady_clock::now();
  core_->deadline = inCallback ? now : now + core_->options.endTimeLimit;
  core_->bell.ring();
  if (inCallback) {
    // What the callback uses may go right after this.
    core_->ledger.silence();
    core_->thread.detach();
  } else if (core_->thread.joinable()) {
    core_->thread.join();
  }
}

QVClientResult<std::unique_ptr<QVReporterSession>> QVReporter::openSession(
    QVReporterSessionOptions options) {
  Code code = Code::outOfMemory;
  try {
    QVReporterSessionState* state = core_->sessions.add(options.reporterID, code);
    if (state != nullptr) {
      // Made first: what is in the queue has to have somebody who destroys it.
      std::unique_ptr<QVReporterSession> session(new (std::nothrow)
                                                     QVReporterSession(core_, *state));
      code = Code::outOfMemory;
      if (session != nullptr) {
        code = core_->take({.kind = QVReporterRecord::Kind::open,
                            .type = static_cast<uint16_t>(options.serviceType),
                            .session = state});
      }
      if (code == Code::none) {
        session->isOpen_ = true;
        return session;
      }
      core_->sessions.release(state->reporterID);
      core_->sessions.remove(*state);
    }
  } catch (const std::bad_alloc&) {
    code = Code::outOfMemory;
  }
  return QVClientError(code, QVClientError::textOf(code));
}

QVClientError::Code QVReporter::sendToEverySession(const QVClientPayload& message,
                                                   QVClientCategory category,
                                                   QVClientMessageType type) {
  return core_->send(nullptr, message, category, type);
}

QVClientError::Code QVReporter::flush(std::chrono::milliseconds timeLimit) {
  if (core_->threadID.load() == std::this_thread::get_id()) return Code::wouldDeadlock;
  return core_->flushes.wait(core_->queue.accepted(), timeLimit, [this] { core_->bell.ring(); });
}

bool QVReporter::isReportingEnabled() const noexcept {
  return !core_->isReportingOff();
}

QVClientError QVReporter::connectionError() const {
  return core_->connection.error();
}

QVReporterCounters QVReporter::counters() const {
  QVReporterCounters counters = core_->ledger.counters();
  counters.queuedMessages = core_->queue.queuedMessages();
  counters.queuedBytes = core_->queue.queuedBytes();
  return counters;
}
