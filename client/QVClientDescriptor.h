#pragma once

#include <utility>

// Owns a file descriptor, or none. Threads: one at a time.
class QVClientDescriptor {
 public:
  QVClientDescriptor() noexcept = default;
  explicit QVClientDescriptor(int descriptor) noexcept : descriptor_(descriptor) {}
  QVClientDescriptor(QVClientDescriptor&& other) noexcept
      : descriptor_(std::exchange(other.descriptor_, -1)) {}
  QVClientDescriptor& operator=(QVClientDescriptor&& other) noexcept;
  ~QVClientDescriptor();

  int get() const noexcept { return descriptor_; }
  bool isOpen() const noexcept { return descriptor_ >= 0; }

 private:
  int descriptor_ = -1;
};
