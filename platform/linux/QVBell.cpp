#include "platform/linux/QVBell.h"

#include <cerrno>
#include <system_error>

#include <sys/eventfd.h>
#include <unistd.h>

QVBell::QVBell() : descriptor_(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
  if (descriptor_ < 0) throw std::system_error(errno, std::generic_category(), "eventfd");
}

QVBell::~QVBell() {
  close(descriptor_);
}

// Neither can fail: the count does not come near its end, and nothing to hush is no harm.
void QVBell::ring() const noexcept {
  static_cast<void>(eventfd_write(descriptor_, 1));
}

void QVBell::hush() const noexcept {
  eventfd_t count = 0;
  static_cast<void>(eventfd_read(descriptor_, &count));
}
