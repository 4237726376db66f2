#include "client/QVReporterWorker.h"

#include <algorithm>
#include <array>
#include <exception>
#include <random>
#include <utility>

#include <poll.h>

namespace {

// A full queue of clients is a service that is not there: the thread must not wait for it, it tries
// again. The least that there is.
constexpr std::chrono::milliseconds kConnectTimeLimit{1};

// Bytes and calls that the connection may hold. Never reached: calls are limited by what is under
// way, and a single one may be as large as a message and the steps of a session.
constexpr std::size_t kConnectionBytes = std::size_t{64} << 20;

// Up to an hour at once, which a wait's milliseconds hold.
constexpr std::chrono::milliseconds kLongestWait = std::chrono::hours(1);

using Clock = std::chrono::steady_clock;

}  // namespace

QVReporterWorker::QVReporterWorker(QVReporterCore& core)
    : core_(core),
      calls_(core),
      delay_(core.options.shortestReconnectDelay, core.options.longestReconnectDelay,
             static_cast<uint32_t>(Clock::now().time_since_epoch().count())) {}

QVReporterWorker::~QVReporterWorker() = default;

void QVReporterWorker::run() {
  for (bool goesOn = true; goesOn;) {
    try {
      goesOn = work();
    } catch (const std::exception&) {
      // Memory is short. The connection goes, so that the next attempt has to wait its pause.
      calls_.lose();
      loseConnection(Clock::now());
      goesOn = Clock::now() < core_.deadline.load();
    }
    if (goesOn) wait();
  }
  finish();
}

bool QVReporterWorker::work() {
  if (std::exchange(hasNewsOfSwitch_, false)) {
    core_.reportingSwitch.readNews();
    followSwitch();
  }
  if (client_ != nullptr && std::exchange(hasAnswers_, false)) client_->dispatch();
  const TimePoint now = Clock::now();
  if (calls_.isLost()) loseConnection(now);
  // Before the queues are looked at: what was committed before a flush or the end belongs to it.
  beginFlush();
  const bool isEnding = core_.deadline.load() != TimePoint::max();
  if (isEnding && !std::exchange(isEnding_, true)) calls_.markRings();
  calls_.work();
  // At the end, once more at once, and only for what is still to be sent.
  const bool mayConnect = isEnding ? !hasTriedAtEnd_ && !mayEnd(now) : now >= delay_.nextAttempt();
  if (client_ == nullptr && mayConnect && calls_.wantsConnection()) {
    hasTriedAtEnd_ = isEnding;
    connect(now);
    calls_.work();
  }
  if (calls_.isAnswered() && !std::exchange(isSwitchSettled_, true)) {
    // The service runs, and has made what was missing to hear of its switch.
    core_.reportingSwitch.lookAgain();
    followSwitch();
  }
  workOffFlush();
  core_.ledger.report(now);
  return !isEnding || !mayEnd(now);
}

void QVReporterWorker::followSwitch() {
  // What the switch has dropped is told of now that it is over.
  const bool isOff = core_.isReportingOff();
  if (std::exchange(wasOff_, isOff) && !isOff) core_.ledger.reportAll(Clock::now());
}

void QVReporterWorker::connect(TimePoint now) {
  QVClientOptions options;
  options.socketPath = core_.options.socketPath;
  options.callbacks = QVClientOptions::Callbacks::pollLoop;
  options.connectionLost = [this](const QVClientError& error) {
    core_.connection.setError(error);
    calls_.lose();
  };
  options.connectTimeLimit = kConnectTimeLimit;
  options.maximumQueuedBytes = kConnectionBytes;
  auto connected = QVClient::connect(std::move(options));
  core_.connection.setError(connected.error());
  if (!connected) {
    delay_.failed(now);
    return;
  }
  client_ = std::move(connected.value());
  delay_.connected(now);
  core_.ledger.countConnection();
  isSwitchSettled_ = false;
  calls_.begin(*client_);
}

void QVReporterWorker::loseConnection(TimePoint now) {
  // What is not answered gets its error here, where the connection itself is not the one to go.
  client_.reset();
  calls_.end();
  delay_.failed(now);
  // Given up by this side, which happens for want of memory alone.
  if (!core_.connection.error()) {
    core_.connection.setError({QVClientError::Code::outOfMemory, "out of memory"});
  }
}

void QVReporterWorker::beginFlush() {
  if (flush_ != Flush::none || !core_.flushes.begin(flushedRecords_)) return;
  calls_.markRings();
  flush_ = Flush::queued;
}

void QVReporterWorker::workOffFlush() {
  if (flush_ == Flush::queued && core_.queue.consumed() >= flushedRecords_ &&
      calls_.areRingsWorkedOff()) {
    flush_ = Flush::underWay;
    flushedCalls_ = calls_.issued();
  }
  if (flush_ == Flush::underWay && calls_.answered() >= flushedCalls_) {
    flush_ = Flush::none;
    core_.flushes.settle();
    // The next one may be waiting already.
    core_.bell.ring();
  }
}

bool QVReporterWorker::mayEnd(TimePoint now) {
  return calls_.isDone() || now >= core_.deadline.load() || (client_ == nullptr && hasTriedAtEnd_);
}

std::optional<QVReporterWorker::TimePoint> QVReporterWorker::nextWakeUp(TimePoint now) {
  std::optional<TimePoint> next = core_.ledger.nextReport();
  const auto orAt = [&next](TimePoint time) { next = next ? std::min(*next, time) : time; };
  if (const TimePoint deadline = core_.deadline.load(); deadline != TimePoint::max()) {
    orAt(deadline);
  }
  if (client_ == nullptr) {
    if (calls_.wantsConnection()) {
      orAt(delay_.nextAttempt());
    } else if (!core_.queue.armWakeUp()) {
      orAt(now);
    }
    return next;
  }
  if (calls_.polls() && !core_.isReportingOff()) orAt(now + core_.options.realtimePeriod);
  if (calls_.isLost() || (calls_.hasRoom() && !core_.queue.armWakeUp())) orAt(now);
  return next;
}

void QVReporterWorker::wait() {
  const TimePoint now = Clock::now();
  const std::optional<TimePoint> next = nextWakeUp(now);
  int milliseconds = -1;
  if (next) {
    // Upwards, so that the time has come when the wait is over.
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(std::max(*next, now) - now);
    milliseconds = static_cast<int>(std::min(left, kLongestWait).count());
  }
  const int socket = client_ != nullptr ? client_->fileDescriptor() : -1;
  std::array<pollfd, 3> entries{{{core_.bell.descriptor(), POLLIN, 0},
                                 {core_.reportingSwitch.descriptor(), POLLIN, 0},
                                 {socket, POLLIN, 0}}};
  // A wait that fails is one that ended early.
  static_cast<void>(poll(entries.data(), entries.size(), milliseconds));
  if (entries[0].revents != 0) core_.bell.silence();
  hasNewsOfSwitch_ = entries[1].revents != 0;
  hasAnswers_ = entries[2].revents != 0;
}

void QVReporterWorker::finish() {
  client_.reset();
  calls_.end();
  calls_.abandon();
  core_.flushes.end();
  core_.ledger.reportAll(Clock::now());
}
