#pragma once

#include "client/QVClientError.h"
#include "client/QVReporterSessionState.h"
#include "platform/linux/QVThreadAnnotations.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>

// The sessions of one reporter, by their IDs. Owns their states.
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
  void remove(const QVReporterSessionState& session);
  // In ascending order of their IDs, until `visit` answers false.
  void forEach(const std::function<bool(QVReporterSessionState&)>& visit);

 private:
  QVMutex mutex_;
  std::map<int64_t, std::unique_ptr<QVReporterSessionState>> states_ QV_GUARDED_BY(mutex_);
};
