#include "client/QVClientBell.h"

#include <sys/eventfd.h>

QVClientBell::QVClientBell() : event_(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {}

void QVClientBell::ring() const {
  static_cast<void>(eventfd_write(event_.get(), 1));
}

void QVClientBell::silence() const {
  eventfd_t count = 0;
  static_cast<void>(eventfd_read(event_.get(), &count));
}
