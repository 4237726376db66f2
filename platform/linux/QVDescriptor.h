#pragma once

#include <cerrno>
#include <utility>

#include <unistd.h>

// Owns a file descriptor, or none: then errno may say why, and is left alone.
//
// Threads: one at a time. Ownership: closes its descriptor.
class QVDescriptor {
 public:
  QVDescriptor() noexcept = default;
  explicit QVDescriptor(int descriptor) noexcept : descriptor_(descriptor) {}
  QVDescriptor(QVDescriptor&& other) noexcept : descriptor_(other.release()) {}
  QVDescriptor& operator=(QVDescriptor&& other) noexcept {
    if (this != &other) {
      close();
      descriptor_ = other.release();
    }
    return *this;
  }
  ~QVDescriptor() { close(); }

  int get() const noexcept { return descriptor_; }
  bool isOpen() const noexcept { return descriptor_ >= 0; }
  // Hands the descriptor over: it is closed by whoever takes it.
  int release() noexcept { return std::exchange(descriptor_, -1); }

 private:
  void close() noexcept {
    if (!isOpen()) return;
    const int number = errno;
    ::close(release());
    errno = number;
  }

  int descriptor_ = -1;
};
