#pragma once

#include <chrono>
#include <condition_variable>
#include <mutex>

// Something that happens once, on any thread, and that others wait for. The limit of a wait only
// ends a test that has failed.
class QVEvent {
 public:
  void happen() {
    const std::lock_guard lock(mutex_);
    hasHappened_ = true;
    changed_.notify_all();
  }
  bool hasHappened() const {
    const std::lock_guard lock(mutex_);
    return hasHappened_;
  }
  bool wait() {
    std::unique_lock lock(mutex_);
    return changed_.wait_for(lock, std::chrono::minutes{1}, [this] { return hasHappened_; });
  }

 private:
  mutable std::mutex mutex_;
  std::condition_variable changed_;
  bool hasHappened_ = false;
};
