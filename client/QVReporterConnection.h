#pragma once

#include "client/QVClientError.h"
#include "platform/linux/QVThreadAnnotations.h"

#include <utility>

// What keeps a reporter from its service: what the last attempt to connect said, or the loss of the
// connection; no error while there is a connection, and before one was needed.
//
// Threads: any, at once; set by the reporter's.
class QVReporterConnection {
 public:
  void setError(QVClientError error) {
    QVMutexLock lock(mutex_);
    error_ = std::move(error);
  }
  QVClientError error() {
    QVMutexLock lock(mutex_);
    return error_;
  }

 private:
  QVMutex mutex_;
  QVClientError error_ QV_GUARDED_BY(mutex_);
};
