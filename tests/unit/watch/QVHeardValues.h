#pragma once

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <mutex>
#include <vector>

// Values that are told on any thread, for a test to wait for. The limit of a wait only ends a test
// that has failed.
class QVHeardValues {
 public:
  void add(int32_t value) {
    const std::lock_guard lock(mutex_);
    values_.push_back(value);
    changed_.notify_all();
  }
  std::vector<int32_t> values() const {
    const std::lock_guard lock(mutex_);
    return values_;
  }
  // The values, once there are so many; those that there are where they do not come in a minute.
  std::vector<int32_t> await(std::size_t count) const {
    std::unique_lock lock(mutex_);
    changed_.wait_for(lock, std::chrono::minutes{1},
                      [this, count] { return values_.size() >= count; });
    return values_;
  }

 private:
  mutable std::mutex mutex_;
  mutable std::condition_variable changed_;
  std::vector<int32_t> values_;
};
