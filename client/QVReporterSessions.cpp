#include "client/QVReporterSessions.h"

#include <chrono>

#include <sys/random.h>

namespace {

// Exact in every tool that keeps numbers as doubles.
constexpr int64_t kLargestPicked = (int64_t{1} << 52) - 1;

int64_t pickReporterID() {
  uint64_t number = 0;
  if (getrandom(&number, sizeof number, GRND_NONBLOCK) != sizeof number) {
    // The machine has only just started.
    number = static_cast<uint64_t>(std::chrono::steady_clock::now().time_since_epoch().count());
  }
  return static_cast<int64_t>(number) & kLargestPicked;
}

}  // namespace

QVReporterSessionState* QVReporterSessions::add(int64_t reporterID, QVClientError::Code& reason) {
  QVMutexLock lock(mutex_);
  if (states_.size() >= kMaximum) {
    reason = QVClientError::Code::tooManySessions;
    return nullptr;
  }
  if (reporterID != 0 && states_.contains(reporterID)) {
    reason = QVClientError::Code::reporterIDTaken;
    return nullptr;
  }
  while (reporterID == 0 || states_.contains(reporterID)) reporterID = pickReporterID();
  auto& state = states_[reporterID];
  state = std::make_unique<QVReporterSessionState>(reporterID);
  return state.get();
}

void QVReporterSessions::remove(const QVReporterSessionState& session) {
  QVMutexLock lock(mutex_);
  states_.erase(session.reporterID);
}

void QVReporterSessions::forEach(const std::function<bool(QVReporterSessionState&)>& visit) {
  QVMutexLock lock(mutex_);
  for (auto& [reporterID, state] : states_) {
    if (!visit(*state)) return;
  }
}
