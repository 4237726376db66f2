#pragma once

#include "client/QVClientBell.h"
#include "platform/linux/QVDescriptor.h"

#include <atomic>
#include <chrono>
#include <optional>

// What a client waits on: its socket, and a bell that other threads ring.
//
// With a thread of the library's own, both lie in one epoll instance, on which that thread waits.
// With a program's loop, the socket has one of its own, on which waiting calls wait without being
// woken by the bell, and the program watches a second one that holds the first and the bell.
//
// Threads: any, at once. Failures: isOpen() is false where the system had no descriptors left.
class QVClientPoller {
 public:
  QVClientPoller(int socket, bool ownThread);

  bool isOpen() const noexcept;
  // What a program's loop, or the library's thread, waits on: readable when there is something to
  // do.
  int descriptor() const noexcept;

  // Waits for something to do.
  void wait() const;
  // Waits for the socket alone; until `deadline` where there is one.
  void waitForSocket(std::optional<std::chrono::steady_clock::time_point> deadline) const;

  // Whether room in the socket is something to do.
  void watchForRoom(bool watch) const;
  // The socket is of no use any more.
  void forgetSocket() const;

  void ring();
  void silence();

 private:
  const int socket_;
  const bool ownThread_;
  QVDescriptor socketEvents_;
  const QVClientBell bell_;
  std::atomic<bool> rang_{false};
  QVDescriptor allEvents_;  // only with a program's loop
};
