#include "client/QVClientPoller.h"

#include <algorithm>
#include <cstdint>

#include <sys/epoll.h>
#include <unistd.h>

namespace {

bool add(int events, int descriptor, uint32_t what) {
  epoll_event event{.events = what, .data = {.fd = descriptor}};
  return epoll_ctl(events, EPOLL_CTL_ADD, descriptor, &event) == 0;
}

// A wait that a signal ends is a wait that ended early; callers look and wait again.
void waitOn(int events, int milliseconds) {
  epoll_event event{};
  static_cast<void>(epoll_wait(events, &event, 1, milliseconds));
}

}  // namespace

QVClientPoller::QVClientPoller(int socket, bool ownThread)
    : socket_(socket), ownThread_(ownThread), socketEvents_(epoll_create1(EPOLL_CLOEXEC)) {
  bool complete =
      socketEvents_.isOpen() && bell_.isOpen() && add(socketEvents_.get(), socket, EPOLLIN);
  if (ownThread) {
    complete = complete && add(socketEvents_.get(), bell_.descriptor(), EPOLLIN);
  } else if (complete) {
    allEvents_ = QVDescriptor(epoll_create1(EPOLL_CLOEXEC));
    complete = allEvents_.isOpen() && add(allEvents_.get(), socketEvents_.get(), EPOLLIN) &&
               add(allEvents_.get(), bell_.descriptor(), EPOLLIN);
  }
  if (!complete) socketEvents_ = QVDescriptor();
}

bool QVClientPoller::isOpen() const noexcept {
  return socketEvents_.isOpen();
}

int QVClientPoller::descriptor() const noexcept {
  return ownThread_ ? socketEvents_.get() : allEvents_.get();
}

void QVClientPoller::wait() const {
  waitOn(descriptor(), -1);
}

void QVClientPoller::waitForSocket(
    std::optional<std::chrono::steady_clock::time_point> deadline) const {
  int milliseconds = -1;
  if (deadline) {
    // Upwards, so that the deadline has passed when the wait is over; and at most an hour at once.
    const auto left =
        std::chrono::ceil<std::chrono::milliseconds>(*deadline - std::chrono::steady_clock::now());
    constexpr std::chrono::milliseconds kLongestWait = std::chrono::hours(1);
    milliseconds =
        static_cast<int>(std::clamp(left, std::chrono::milliseconds::zero(), kLongestWait).count());
  }
  waitOn(socketEvents_.get(), milliseconds);
}

void QVClientPoller::watchForRoom(bool watch) const {
  epoll_event event{.events = watch ? uint32_t{EPOLLIN | EPOLLOUT} : uint32_t{EPOLLIN},
                    .data = {.fd = socket_}};
  static_cast<void>(epoll_ctl(socketEvents_.get(), EPOLL_CTL_MOD, socket_, &event));
}

void QVClientPoller::forgetSocket() const {
  static_cast<void>(epoll_ctl(socketEvents_.get(), EPOLL_CTL_DEL, socket_, nullptr));
}

void QVClientPoller::ring() {
  // In this order: a bell that is silenced in between rings once too often, and never too seldom.
  bell_.ring();
  rang_.store(true);
}

void QVClientPoller::silence() {
  // Spares a system call where it did not ring, which is nearly always.
  if (rang_.exchange(false)) bell_.silence();
}
