#pragma once

#include <cstdint>
#include <optional>
#include <string>

// This process and what the kernel tells of others.
//
// Threads: any, at once.
class QVProcess {
 public:
  virtual ~QVProcess() = default;
  virtual int32_t ownProcessIdentifier() const = 0;
  virtual std::string ownProcessName() const = 0;
  // The short command name of a running process; nothing where the kernel has no such process or
  // does not tell.
  virtual std::optional<std::string> nameOfProcess(int32_t processIdentifier) const = 0;
  // Ends the whole process at once with this exit status; nothing is flushed, no destructor runs.
  // Only a fake returns.
  virtual void exitImmediately(int status) = 0;
};
