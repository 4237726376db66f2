#pragma once

#include <condition_variable>
#include <mutex>

// Clang's thread-safety annotations, and a mutex that carries them: the compiler then refuses code
// that touches a guarded member without the lock. Other compilers see nothing of it.

#if defined(__clang__)
#define QV_ATTRIBUTE(x) __attribute__((x))
#else
#define QV_ATTRIBUTE(x)
#endif

#define QV_CAPABILITY(name) QV_ATTRIBUTE(capability(name))
#define QV_SCOPED_CAPABILITY QV_ATTRIBUTE(scoped_lockable)
#define QV_GUARDED_BY(mutex) QV_ATTRIBUTE(guarded_by(mutex))
#define QV_REQUIRES(...) QV_ATTRIBUTE(requires_capability(__VA_ARGS__))
#define QV_EXCLUDES(...) QV_ATTRIBUTE(locks_excluded(__VA_ARGS__))
#define QV_ACQUIRE(...) QV_ATTRIBUTE(acquire_capability(__VA_ARGS__))
#define QV_RELEASE(...) QV_ATTRIBUTE(release_capability(__VA_ARGS__))
#define QV_NO_THREAD_SAFETY_ANALYSIS QV_ATTRIBUTE(no_thread_safety_analysis)

// A mutex, not recursive, that the annotations know of. Any thread; held with a QVMutexLock.
class QV_CAPABILITY("mutex") QVMutex {
 public:
  void lock() QV_ACQUIRE() { mutex_.lock(); }
  void unlock() QV_RELEASE() { mutex_.unlock(); }

 private:
  friend class QVMutexLock;
  std::mutex mutex_;
};

// Holds a QVMutex for its scope; may be let go early and waited with.
class QV_SCOPED_CAPABILITY QVMutexLock {
 public:
  explicit QVMutexLock(QVMutex& mutex) QV_ACQUIRE(mutex) : lock_(mutex.mutex_) {}
  ~QVMutexLock() QV_RELEASE() = default;
  QVMutexLock(const QVMutexLock&) = delete;
  QVMutexLock& operator=(const QVMutexLock&) = delete;

  void lock() QV_ACQUIRE() { lock_.lock(); }
  void unlock() QV_RELEASE() { lock_.unlock(); }

  // Waits on `condition`; the mutex is held before and after, not meanwhile.
  void wait(std::condition_variable& condition) { condition.wait(lock_); }
  template <class Clock, class Duration>
  std::cv_status waitUntil(std::condition_variable& condition,
                           const std::chrono::time_point<Clock, Duration>& deadline) {
    return condition.wait_until(lock_, deadline);
  }

 private:
  std::unique_lock<std::mutex> lock_;
};
