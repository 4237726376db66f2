#include "QVServices/Statistics/Service/QVReportingBlockThrottle.h"

#include "QVServices/Statistics/QVReportingUtility.h"
#include "QVServices/Statistics/Service/QVReportingRunStep.h"
#include "platform/QVPlatform.h"

#include <chrono>
#include <cstddef>
#include <optional>
#include <utility>

namespace {

constexpr const char* kInit = "-[QVReportingBlockThrottle init]";
constexpr const char* kAddMessageBlock =
    "-[QVReportingBlockThrottle addMessageBlock:reporterID:message:category:type:]";
constexpr const char* kWaitForCompletion = "-[QVReportingBlockThrottle waitForCompletion]";

constexpr std::string_view kThreadName = "qv-throttle";

// What the array of keys has room for at first: more than one pass of the thread finds, mostly.
constexpr std::size_t kUnscheduledTimerKeysCapacity = 6;

// How long the thread sleeps between its passes, and so by how much a timer may fire late.
constexpr QVDuration kPassPeriod = std::chrono::milliseconds{100};

constexpr std::chrono::seconds kLongestCompletion{5};
constexpr int kCompletionPolls = 10;
constexpr QVDuration kCompletionPollPeriod = QVDuration{kLongestCompletion} / kCompletionPolls;

std::vector<std::string> emptyKeys() {
  std::vector<std::string> keys;
  keys.reserve(kUnscheduledTimerKeysCapacity);
  return keys;
}

QVLog& log() {
  return *QVPlatform::shared().log;
}

// Of a pass of the thread. Whatever goes wrong in one, the next one follows: blocks are waiting.
template <class Step>
void runStep(std::string_view what, const Step& step) noexcept {
  QVReportingRunStep(nullptr, kInit, what, std::nullopt, step);
}

}  // namespace

QVReportingBlockThrottle::QVReportingBlockThrottle()
    : threads_(*QVPlatform::shared().runLoopThreads), unscheduledTimerKeys_(emptyKeys()) {}

std::shared_ptr<QVReportingBlockThrottle> QVReportingBlockThrottle::init() {
  std::shared_ptr<QVReportingBlockThrottle> throttle(new QVReportingBlockThrottle);
  throttle->queueThread_ = throttle->threads_.startThread(
      kThreadName, [throttle](QVRunLoop& workingRunLoop) { throttle->runThread(workingRunLoop); });
  if (throttle->queueThread_ == nullptr) return nullptr;
  return throttle;
}

void QVReportingBlockThrottle::runThread(QVRunLoop& workingRunLoop) {
  while (shouldKeepRunning_) {
    if (unscheduledTimerKeysCount() > 0) {
      runStep("log the run", [] {
        log().verbose(nullptr, kInit, "calling workingRunLoop run from inside thread block");
      });
      attachUnscheduledTimers(workingRunLoop);
      // Until the last of them has fired; keys that come meanwhile have to wait for that.
      runStep("run timers", [&workingRunLoop] { workingRunLoop.run(); });
    }
    runStep("log the pause", [] { log().verbose(nullptr, kInit, "sleeping in thread"); });
    threads_.pause(kPassPeriod);
  }
}

void QVReportingBlockThrottle::attachUnscheduledTimers(QVRunLoop& workingRunLoop) {
  std::size_t attached = 0;
  runStep("attach timers", [this, &workingRunLoop, &attached] {
    for (const std::size_t count = unscheduledTimerKeysCount(); attached < count; ++attached) {
      workingRunLoop.attach(timerOfUnscheduledKey(attached));
    }
  });
  // After a failure the others stay, for the next pass. Nobody else takes keys out.
  const std::lock_guard lock(unscheduledTimerKeysLock_);
  const auto first = unscheduledTimerKeys_.begin();
  unscheduledTimerKeys_.erase(first, first + static_cast<std::ptrdiff_t>(attached));
}

std::shared_ptr<QVRunLoopTimer> QVReportingBlockThrottle::timerOfUnscheduledKey(
    std::size_t index) const {
  std::string key;
  {
    const std::lock_guard lock(unscheduledTimerKeysLock_);
    key = unscheduledTimerKeys_[index];
  }
  // Only its timer's firing removes a key, and that comes after this.
  const std::lock_guard lock(timersInFlightLock_);
  return timersInFlight_.at(key)->timer();
}

void QVReportingBlockThrottle::addMessageBlock(Block block, int64_t reporterID,
                                               const QVDictionary& message, uint32_t category,
                                               uint16_t type) {
  const std::string key = buildMessageKey(message, reporterID, category, type);
  const double delay = determineSleepTime(message);
  {
    const std::lock_guard lock(timersInFlightLock_);
    const auto pending = timersInFlight_.find(key);
    if (pending != timersInFlight_.end()) {
      log().verbose(nullptr, kAddMessageBlock, "Dropping duplicate message for ", key);
      pending->second->sleepFor(delay);
      // The block that was there goes with the argument, after the lock.
      block = pending->second->setBlock(std::move(block));
      return;
    }
    const auto wrapper = std::make_shared<Wrapper>(std::move(block));
    // The timer can fire nowhere but on the thread, which holds the throttle.
    wrapper->setTimer(
        threads_.makeTimer(QVReportingDurationFromSeconds(delay), [this, key] { fire(key); }));
    timersInFlight_.emplace(key, wrapper);
  }
  try {
    const std::lock_guard lock(unscheduledTimerKeysLock_);
    unscheduledTimerKeys_.push_back(key);
  } catch (...) {
    // Nobody would ever attach its timer.
    removeKey(key);
    throw;
  }
}

void QVReportingBlockThrottle::fire(const std::string& key) {
  try {
    // Gone before its key is free: what waits for completion may rely on it.
    if (Block block = takeBlock(key)) block();
  } catch (...) {
    removeKey(key);
    throw;
  }
  removeKey(key);
}

// Out of the wrapper, where a duplicate may put another one while this one runs.
QVReportingBlockThrottle::Block QVReportingBlockThrottle::takeBlock(const std::string& key) {
  const std::lock_guard lock(timersInFlightLock_);
  return timersInFlight_.at(key)->setBlock(nullptr);
}

void QVReportingBlockThrottle::removeKey(const std::string& key) {
  std::shared_ptr<Wrapper> wrapper;
  const std::lock_guard lock(timersInFlightLock_);
  const auto pending = timersInFlight_.find(key);
  pending->second->timer()->invalidate();
  // What a late duplicate left in it goes after the lock.
  wrapper = std::exchange(pending->second, nullptr);
  timersInFlight_.erase(pending);
}

void QVReportingBlockThrottle::waitForCompletion() {
  std::size_t pending = timersInFlightCount();
  log().info(nullptr, kWaitForCompletion, "waitForCompletion. timersInFlight=", pending,
             " unscheduledTimerKeys=", unscheduledTimerKeysCount());
  if (pending == 0) return;
  log().verbose(nullptr, kWaitForCompletion, "Waiting up to ", kLongestCompletion.count(),
                " seconds for blockThrottle queue to be empty.");
  for (int poll = 0; poll < kCompletionPolls && pending > 0; ++poll) {
    threads_.pause(kCompletionPollPeriod);
    pending = timersInFlightCount();
  }
  if (pending == 0) return;
  log().standard(nullptr, kWaitForCompletion, "Giving up on waiting for completion after ",
                 kLongestCompletion.count(), " seconds. timersInFlight=", pending);
}

std::size_t QVReportingBlockThrottle::timersInFlightCount() const {
  const std::lock_guard lock(timersInFlightLock_);
  return timersInFlight_.size();
}

std::size_t QVReportingBlockThrottle::unscheduledTimerKeysCount() const {
  const std::lock_guard lock(unscheduledTimerKeysLock_);
  return unscheduledTimerKeys_.size();
}

std::vector<std::string> QVReportingBlockThrottle::timersInFlight() const {
  std::vector<std::string> keys;
  const std::lock_guard lock(timersInFlightLock_);
  for (const auto& [key, wrapper] : timersInFlight_) keys.push_back(key);
  return keys;
}

std::vector<std::string> QVReportingBlockThrottle::unscheduledTimerKeys() const {
  const std::lock_guard lock(unscheduledTimerKeysLock_);
  return unscheduledTimerKeys_;
}
