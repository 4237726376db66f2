#pragma once

#include <chrono>
#include <condition_variable>
#include <mutex>

// Learns of the ends of threads that others own. Outlives the threads that it watches. The limit of
// a wait only ends a test that has failed.
class QVThreadEnds {
 public:
  // From now on the calling thread counts, once, however often it asks for that; it is watched by
  // the first that it asks.
  void watchThisThread() { thread_local const Watch kWatch(*this); }

  bool waitUntilWatched(int count) {
    std::unique_lock lock(mutex_);
    return changed_.wait_for(lock, std::chrono::minutes{1},
                             [this, count] { return watchedCount_ >= count; });
  }
  int watchedCount() const {
    const std::lock_guard lock(mutex_);
    return watchedCount_;
  }
  // Of those that are watched, the ones that have not ended.
  int leftCount() const {
    const std::lock_guard lock(mutex_);
    return leftCount_;
  }
  bool waitUntilLeft(int most) {
    std::unique_lock lock(mutex_);
    return changed_.wait_for(lock, std::chrono::minutes{1},
                             [this, most] { return leftCount_ <= most; });
  }

 private:
  // Lives as long as the thread that it is made on.
  class Watch {
   public:
    explicit Watch(QVThreadEnds& ends) : ends_(ends) {
      const std::lock_guard lock(ends_.mutex_);
      ++ends_.watchedCount_;
      ++ends_.leftCount_;
      ends_.changed_.notify_all();
    }
    ~Watch() {
      const std::lock_guard lock(ends_.mutex_);
      --ends_.leftCount_;
      ends_.changed_.notify_all();
    }
    Watch(const Watch&) = delete;
    Watch& operator=(const Watch&) = delete;

   private:
    QVThreadEnds& ends_;
  };

  mutable std::mutex mutex_;
  std::condition_variable changed_;
  int watchedCount_ = 0;
  int leftCount_ = 0;
};
