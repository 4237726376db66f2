#pragma once

#include <stdexcept>

#include <fcntl.h>
#include <sys/resource.h>
#include <unistd.h>

// AddressSanitizer opens a pipe to look at an object, and calls it broken where it gets none.
#if defined(__SANITIZE_ADDRESS__)
inline constexpr bool kObjectsNeedDescriptors = true;
#else
inline constexpr bool kObjectsNeedDescriptors = false;
#endif

// While it lives this process gets no more descriptors than so many.
//
// Threads: one at a time; every thread is held to it.
class QVDescriptorLimit {
 public:
  explicit QVDescriptorLimit(rlim_t more = 0) {
    if (::getrlimit(RLIMIT_NOFILE, &before_) != 0) {
      throw std::runtime_error("the limit of descriptors is not to be had");
    }
    const rlimit limit{.rlim_cur = inUse() + more, .rlim_max = before_.rlim_max};
    if (::setrlimit(RLIMIT_NOFILE, &limit) != 0) {
      throw std::runtime_error("descriptors cannot be limited");
    }
  }
  ~QVDescriptorLimit() { ::setrlimit(RLIMIT_NOFILE, &before_); }
  QVDescriptorLimit(const QVDescriptorLimit&) = delete;
  QVDescriptorLimit& operator=(const QVDescriptorLimit&) = delete;

  // The process's next descriptor: how many it has, where none was closed among them.
  static rlim_t inUse() {
    const int next = ::open("/dev/null", O_RDONLY | O_CLOEXEC);
    if (next < 0 || ::close(next) != 0) throw std::runtime_error("no descriptor is to be had");
    return static_cast<rlim_t>(next);
  }

 private:
  rlimit before_{};
};
