#include "tests/support/QVFileReadings.h"

#include <stdexcept>

#include <poll.h>
#include <sys/inotify.h>
#include <unistd.h>

namespace {

constexpr int kLimit = 60'000;  // milliseconds

}  // namespace

QVFileReadings::QVFileReadings(const std::filesystem::path& file)
    : descriptor_(::inotify_init1(IN_CLOEXEC | IN_NONBLOCK)) {
  if (::inotify_add_watch(descriptor_, file.c_str(), IN_CLOSE_NOWRITE) < 0) {
    throw std::runtime_error("cannot watch " + file.string());
  }
}

QVFileReadings::~QVFileReadings() {
  ::close(descriptor_);
}

bool QVFileReadings::await() {
  return await(kLimit);
}

bool QVFileReadings::haveHappened() {
  return await(0);
}

bool QVFileReadings::await(int milliseconds) {
  pollfd event{descriptor_, POLLIN, 0};
  if (::poll(&event, 1, milliseconds) != 1) return false;
  char buffer[4096];
  while (::read(descriptor_, buffer, sizeof buffer) > 0) {
  }
  return true;
}
