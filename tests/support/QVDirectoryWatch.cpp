#include "tests/support/QVDirectoryWatch.h"

#include <chrono>
#include <stdexcept>

#include <poll.h>
#include <sys/inotify.h>
#include <unistd.h>

namespace {

constexpr std::chrono::seconds kLimit{60};

}  // namespace

QVDirectoryWatch::QVDirectoryWatch(const std::filesystem::path& directory)
    : descriptor_(::inotify_init1(IN_CLOEXEC | IN_NONBLOCK)) {
  constexpr uint32_t kEvents =
      IN_MODIFY | IN_CREATE | IN_DELETE | IN_MOVED_FROM | IN_MOVED_TO | IN_CLOSE_WRITE;
  if (::inotify_add_watch(descriptor_, directory.c_str(), kEvents) < 0) {
    throw std::runtime_error("cannot watch " + directory.string());
  }
}

QVDirectoryWatch::~QVDirectoryWatch() {
  ::close(descriptor_);
}

bool QVDirectoryWatch::await(const std::function<bool()>& condition) const {
  const auto deadline = std::chrono::steady_clock::now() + kLimit;
  while (!condition()) {
    const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(
        deadline - std::chrono::steady_clock::now());
    if (left.count() <= 0) return false;
    pollfd events{descriptor_, POLLIN, 0};
    if (::poll(&events, 1, static_cast<int>(left.count())) != 1) return condition();
    char buffer[65536];
    while (::read(descriptor_, buffer, sizeof buffer) > 0) {
    }
  }
  return true;
}
