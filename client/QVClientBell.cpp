#include "client/QVClientBell.h"

#include <sys/eventfd.h>

QVClientBell::QVClientBell() : event_(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {}

void QVClientBell::ring() {
  // In this order: a bell that is silenced in between rings once too often, and never too seldom.
  static_cast<void>(eventfd_write(event_.get(), 1));
  rang_.store(true);
}

void QVClientBell::silence() {
  // Spares a system call where it did not ring, which is nearly always.
  if (!rang_.exchange(false)) return;
  eventfd_t count = 0;
  static_cast<void>(eventfd_read(event_.get(), &count));
}
