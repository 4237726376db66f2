#pragma once

#include "platform/QVRandom.h"
#include "platform/QVText.h"
#include "platform/fake/QVFakeAbort.h"

#include <deque>
#include <mutex>
#include <vector>

// Draws what the test has scripted; with an empty script 0, 1, 2, ... within the bound. A scripted
// value that lies beyond the bound it is drawn for is the test's mistake and ends the program.
// Threads: any, at once.
class QVFakeRandom final : public QVRandom {
 public:
  uint32_t uniform(uint32_t bound) override {
    const std::lock_guard lock(mutex_);
    bounds_.push_back(bound);
    if (script_.empty()) return next_++ % bound;
    const uint32_t value = script_.front();
    script_.pop_front();
    if (value >= bound) {
      QVFakeAbort(QVText("QVFakeRandom: scripted ", value, " is not below the bound ", bound));
    }
    return value;
  }

  void script(const std::vector<uint32_t>& values) {
    const std::lock_guard lock(mutex_);
    script_.insert(script_.end(), values.begin(), values.end());
  }
  // The bounds of all draws so far.
  std::vector<uint32_t> bounds() const {
    const std::lock_guard lock(mutex_);
    return bounds_;
  }

 private:
  mutable std::mutex mutex_;
  // Guarded by mutex_.
  std::deque<uint32_t> script_;
  std::vector<uint32_t> bounds_;
  uint32_t next_ = 0;
};
