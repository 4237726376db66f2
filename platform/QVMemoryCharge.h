#pragma once

#include <cstddef>

// Is told of memory that messages of one origin occupy. Any thread. Whoever makes one keeps it
// alive until everything that was added has been removed.
class QVMemoryCharge {
 public:
  virtual void add(std::size_t bytes) noexcept = 0;
  virtual void remove(std::size_t bytes) noexcept = 0;

 protected:
  ~QVMemoryCharge() = default;
};
