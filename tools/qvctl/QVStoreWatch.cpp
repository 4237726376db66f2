#include "tools/qvctl/QVStoreWatch.h"

#include "tools/qvctl/QVToolFailure.h"

#include <array>
#include <cerrno>

#include <sys/inotify.h>

namespace {

constexpr uint32_t kChanges =
    IN_MODIFY | IN_CREATE | IN_DELETE | IN_MOVED_TO | IN_MOVED_FROM | IN_DELETE_SELF | IN_MOVE_SELF;

}  // namespace

QVStoreWatch::QVStoreWatch(const std::filesystem::path& store)
    : descriptor_(::inotify_init1(IN_CLOEXEC | IN_NONBLOCK)) {
  const std::string directory = store.parent_path().string();
  if (!descriptor_.isOpen() ||
      ::inotify_add_watch(descriptor_.get(), directory.c_str(), kChanges) < 0) {
    throw QVToolFailure::ofSystem(directory, errno);
  }
}

void QVStoreWatch::drain() const {
  alignas(inotify_event) std::array<char, 4096> events;
  while (::read(descriptor_.get(), events.data(), events.size()) > 0) {
  }
}
