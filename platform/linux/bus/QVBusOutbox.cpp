#include "platform/linux/bus/QVBusOutbox.h"

#include "platform/linux/QVWakeUpBatch.h"

void QVBusOutbox::putBytes(std::string_view bytes) {
  const QVMutexLock lock(mutex_);
  if (closed_ || bytes.empty()) return;
  bytes_.append(bytes);
  wakeOnce();
}

void QVBusOutbox::wakeOnce() {
  if (woken_) return;
  woken_ = true;
  if (auto* const wakeUps = QVWakeUpBatch::current()) {
    wakeUps->add([self = shared_from_this()] { self->wake(); });
  } else {
    // Under the lock: once closed, the loop that is woken may be gone.
    wake_();
  }
}

void QVBusOutbox::wake() {
  const QVMutexLock lock(mutex_);
  if (!closed_) wake_();
}

void QVBusOutbox::hold() {
  const QVMutexLock lock(mutex_);
  woken_ = true;
}

void QVBusOutbox::take(std::string& empty) {
  const QVMutexLock lock(mutex_);
  bytes_.swap(empty);
  woken_ = false;
}

std::size_t QVBusOutbox::size() {
  const QVMutexLock lock(mutex_);
  return bytes_.size();
}

bool QVBusOutbox::hasOverflowed() {
  const QVMutexLock lock(mutex_);
  return overflowed_;
}

void QVBusOutbox::close() {
  const QVMutexLock lock(mutex_);
  closed_ = true;
  wake_ = nullptr;
  std::string().swap(bytes_);
}
