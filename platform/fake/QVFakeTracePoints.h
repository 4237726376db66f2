#pragma once

#include "platform/QVTracePoints.h"

#include <array>
#include <mutex>
#include <vector>

// Keeps the marks in order. Threads: any, at once.
class QVFakeTracePoints final : public QVTracePoints {
 public:
  struct Mark {
    uint32_t code;
    std::array<uint64_t, 4> arguments;
    bool operator==(const Mark&) const = default;
  };

  void trace(uint32_t code, uint64_t first, uint64_t second, uint64_t third,
             uint64_t fourth) override {
    const std::lock_guard lock(mutex_);
    marks_.push_back({code, {first, second, third, fourth}});
  }

  std::vector<Mark> marks() const {
    const std::lock_guard lock(mutex_);
    return marks_;
  }
  std::vector<uint32_t> codes() const {
    std::vector<uint32_t> codes;
    for (const Mark& mark : marks()) codes.push_back(mark.code);
    return codes;
  }
  void clear() {
    const std::lock_guard lock(mutex_);
    marks_.clear();
  }

 private:
  mutable std::mutex mutex_;
  std::vector<Mark> marks_;  // guarded by mutex_
};
