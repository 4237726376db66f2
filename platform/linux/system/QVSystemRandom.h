#pragma once

#include "platform/QVRandom.h"
#include "platform/linux/QVThreadAnnotations.h"

#include <random>

// Draws of a small generator that the kernel's random source has seeded. Threads: any.
class QVSystemRandom final : public QVRandom {
 public:
  uint32_t uniform(uint32_t bound) override {
    const QVMutexLock lock(mutex_);
    return std::uniform_int_distribution<uint32_t>(0, bound - 1)(engine_);
  }

 private:
  QVMutex mutex_;
  std::minstd_rand engine_ QV_GUARDED_BY(mutex_){std::random_device{}()};
};
