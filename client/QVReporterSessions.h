#pragma once

#include "client/QVClientError.h"
#include "client/QVReporterSessionState.h"
#include "platform/linux/QVThreadAnnotations.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <vector>

// The sessions of one reporter. Owns their states.
//
// An ID is free again as soon as its session's destruction lies in the queue: the opening of
// another of that ID lies behind it. So there may be several states of one ID, of which one is
// open.
//
// Threads: any, at once; what forEach() is given runs under the lock. A state itself is the
// reporter's thread's.
class QVReporterSessions {
 public:
  // As many as the service gives one connection.
  static constexpr std::size_t kMaximum = 65'536;

  // A session of that ID, of one that is free where it is 0. Null, and why, where there can be
  // none.
  QVReporterSessionState* add(int64_t reporterID, QVClientError::Code& reason);
  // Its ID may be used again; the state stays.
  void release(int64_t reporterID);
  // The state goes.
  void remove(const QVReporterSessionState& session);
  // Those that are open, `most` of them, with IDs above that one, or from the lowest on. They stay
  // until the reporter's thread, whose function this is, removes them.
  std::vector<QVReporterSessionState*> openAbove(const std::optional<int64_t>& reporterID,
                                                 std::size_t most);
  // In ascending order of their IDs, until `visit` answers false.
  void forEach(const std::function<bool(QVReporterSessionState&)>& visit);

 private:
  QVMutex mutex_;
  std::multimap<int64_t, std::unique_ptr<QVReporterSessionState>> states_ QV_GUARDED_BY(mutex_);
  std::set<int64_t> used_ QV_GUARDED_BY(mutex_);
};
