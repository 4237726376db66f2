#pragma once

#include <cstdint>

// A source of random numbers; good enough to spread load, not for secrets.
//
// Threads: any, at once. Never fails, never blocks.
class QVRandom {
 public:
  virtual ~QVRandom() = default;
  // A uniform draw from 0 to `bound` - 1. `bound` is at least 1.
  virtual uint32_t uniform(uint32_t bound) = 0;
};
