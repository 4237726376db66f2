#pragma once

#include "platform/QVTracePoints.h"

// Trace points as one USDT probe, quietvox:trace, with the code and the four arguments: a tracer
// finds it in the program's notes and puts a breakpoint there; without one it is a single no-op
// instruction.
class QVSDTTracePoints final : public QVTracePoints {
 public:
  void trace(uint32_t code, uint64_t first, uint64_t second, uint64_t third,
             uint64_t fourth) override;
};
