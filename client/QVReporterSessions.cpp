#include "client/QVReporterSessions.h"

#include <algorithm>
#include <chrono>
#include <utility>

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
  if (reporterID != 0 && used_.contains(reporterID)) {
    reason = QVClientError::Code::reporterIDTaken;
    return nullptr;
  }
  while (reporterID == 0 || used_.contains(reporterID)) reporterID = pickReporterID();
  auto made = std::make_unique<QVReporterSessionState>(reporterID);
  QVReporterSessionState* const state = made.get();
  const auto place = states_.emplace(reporterID, std::move(made));
  try {
    used_.insert(reporterID);
  } catch (...) {
    states_.erase(place);
    throw;
  }
  return state;
}

void QVReporterSessions::release(int64_t reporterID) {
  QVMutexLock lock(mutex_);
  used_.erase(reporterID);
}

void QVReporterSessions::remove(const QVReporterSessionState& session) {
  QVMutexLock lock(mutex_);
  const auto [begin, end] = states_.equal_range(session.reporterID);
  const auto found =
      std::find_if(begin, end, [&](const auto& entry) { return entry.second.get() == &session; });
  if (found != end) states_.erase(found);
}

std::vector<QVReporterSessionState*> QVReporterSessions::openAbove(
    const std::optional<int64_t>& reporterID, std::size_t most) {
  std::vector<QVReporterSessionState*> sessions;
  sessions.reserve(most);
  QVMutexLock lock(mutex_);
  auto entry = reporterID ? states_.upper_bound(*reporterID) : states_.begin();
  for (; entry != states_.end() && sessions.size() < most; ++entry) {
    if (entry->second->isOpen) sessions.push_back(entry->second.get());
  }
  return sessions;
}

void QVReporterSessions::forEach(const std::function<bool(QVReporterSessionState&)>& visit) {
  QVMutexLock lock(mutex_);
  for (auto& [reporterID, state] : states_) {
    if (!visit(*state)) return;
  }
}
