#pragma once

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <mutex>

// Counts something that happens on any thread, for others to wait for. The limit of a wait only
// ends a test that has failed.
class QVOccurrences {
 public:
  void happen() {
    const std::lock_guard lock(mutex_);
    ++count_;
    changed_.notify_all();
  }
  std::size_t count() const {
    const std::lock_guard lock(mutex_);
    return count_;
  }
  // Has it happened that often, or does it within a minute?
  [[nodiscard]] bool await(std::size_t count) const {
    std::unique_lock lock(mutex_);
    return changed_.wait_for(lock, std::chrono::minutes{1},
                             [this, count] { return count_ >= count; });
  }

 private:
  mutable std::mutex mutex_;
  mutable std::condition_variable changed_;
  std::size_t count_ = 0;
};
