#pragma once

#include <utility>

#include <unistd.h>

// A descriptor of the system that is closed when it goes. A value that can be moved.
class QVDescriptor {
 public:
  explicit QVDescriptor(int descriptor = -1) noexcept : descriptor_(descriptor) {}
  ~QVDescriptor() {
    if (descriptor_ >= 0) ::close(descriptor_);
  }
  QVDescriptor(QVDescriptor&& other) noexcept : descriptor_(std::exchange(other.descriptor_, -1)) {}
  QVDescriptor& operator=(QVDescriptor&& other) noexcept {
    std::swap(descriptor_, other.descriptor_);
    return *this;
  }

  bool isOpen() const noexcept { return descriptor_ >= 0; }
  int get() const noexcept { return descriptor_; }

 private:
  int descriptor_;
};
