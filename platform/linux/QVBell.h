#pragma once

// Wakes a thread that sleeps in poll(): once rung, the descriptor is readable until it is hushed.
// Rings that nobody has heard yet are one.
//
// Threads: any, at once. Ownership: closes its descriptor.
// Failures: the constructor throws std::system_error where there are no descriptors left.
class QVBell {
 public:
  QVBell();
  ~QVBell();
  QVBell(const QVBell&) = delete;
  QVBell& operator=(const QVBell&) = delete;

  int descriptor() const noexcept { return descriptor_; }
  void ring() const noexcept;
  void hush() const noexcept;

 private:
  const int descriptor_;
};
