#pragma once

#include <cstdint>

// Kernel trace points: marks that a tracer outside of the process sees with their code and four
// arguments. Costs next to nothing while nobody traces.
//
// Threads: any, at once. Never fails, never blocks.
class QVTracePoints {
 public:
  virtual ~QVTracePoints() = default;
  virtual void trace(uint32_t code, uint64_t first, uint64_t second, uint64_t third,
                     uint64_t fourth) = 0;

  // All four arguments 0.
  void mark(uint32_t code) { trace(code, 0, 0, 0, 0); }
};
