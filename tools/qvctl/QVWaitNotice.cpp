#include "tools/qvctl/QVWaitNotice.h"

#include <algorithm>
#include <cerrno>
#include <limits>
#include <string_view>

#include <poll.h>
#include <sys/eventfd.h>

namespace {

constexpr std::string_view kLine = "qvctl: waiting for the service ...\n";

}  // namespace

QVWaitNotice::QVWaitNotice(std::chrono::milliseconds after, int descriptor)
    : over_(::isatty(descriptor) == 1 ? ::eventfd(0, EFD_CLOEXEC) : -1) {
  if (!over_.isOpen()) return;
  // Where the system has no thread to spare, nothing is said.
  static_cast<void>(thread_.start([this, after, descriptor] { run(after, descriptor); }));
}

bool QVWaitNotice::end() {
  if (thread_.joinable()) {
    ::eventfd_write(over_.get(), 1);
    thread_.join();
  }
  return isSaid_;
}

void QVWaitNotice::run(std::chrono::milliseconds after, int descriptor) {
  const auto limit = std::clamp<int64_t>(after.count(), 0, std::numeric_limits<int>::max());
  pollfd entry{over_.get(), POLLIN, 0};
  int ready = -1;
  do {
    ready = ::poll(&entry, 1, static_cast<int>(limit));
  } while (ready < 0 && errno == EINTR);
  if (ready != 0) return;
  isSaid_ = true;
  // Whoever sat there may have gone.
  static_cast<void>(::write(descriptor, kLine.data(), kLine.size()));
}
