#include "platform/linux/bus/QVBusSocket.h"

#include "platform/linux/bus/QVBusLoop.h"

#include <algorithm>
#include <cerrno>
#include <utility>

#include <asio/io_context.hpp>
#include <asio/posix/stream_descriptor.hpp>
#include <fcntl.h>
#include <poll.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <unistd.h>

struct QVBusSocket::Descriptor {
  asio::posix::stream_descriptor waiter;
};

namespace {

QVBusSocket::Result resultOf(ssize_t bytes, QVBusSocket::Status onZero) {
  using Status = QVBusSocket::Status;
  if (bytes > 0) return {Status::done, static_cast<std::size_t>(bytes)};
  if (bytes == 0) return {onZero, 0};
  const bool later = errno == EAGAIN || errno == EWOULDBLOCK || errno == EINTR;
  return {later ? Status::wouldBlock : Status::failed, 0};
}

// Is one left besides the reserved ones? `descriptor` is any open one.
bool hasDescriptorForClient(int descriptor) {
  rlimit limit{};
  if (::getrlimit(RLIMIT_NOFILE, &limit) != 0) return true;
  // The kernel gives the lowest that is free: the rest of those that are lie above it.
  const int lowest = ::fcntl(descriptor, F_DUPFD_CLOEXEC, 0);
  if (lowest < 0) return false;
  ::close(lowest);
  const auto reserved = std::min<rlim_t>(QVBusSocket::kReservedDescriptors, limit.rlim_cur / 8);
  return static_cast<rlim_t>(lowest) < limit.rlim_cur - reserved;
}

}  // namespace

QVBusSocket::QVBusSocket(QVBusLoop& loop, int descriptor)
    : descriptor_(std::make_unique<Descriptor>(
          Descriptor{asio::posix::stream_descriptor(loop.context())})) {
  asio::error_code error;
  descriptor_->waiter.assign(descriptor, error);
  // The kernel would not watch it; waits then fail at once and so does the connection.
  if (error) ::close(descriptor);
}

QVBusSocket::~QVBusSocket() {
  close();
}

int QVBusSocket::descriptor() const noexcept {
  return descriptor_->waiter.is_open() ? descriptor_->waiter.native_handle() : -1;
}

QVBusSocket::Result QVBusSocket::receive(std::span<char> buffer) {
  return resultOf(::recv(descriptor(), buffer.data(), buffer.size(), MSG_DONTWAIT), Status::ended);
}

QVBusSocket::Result QVBusSocket::send(std::string_view bytes) {
  return resultOf(::send(descriptor(), bytes.data(), bytes.size(), MSG_DONTWAIT | MSG_NOSIGNAL),
                  Status::done);
}

int QVBusSocket::accept() {
  int error = EMFILE;
  if (hasDescriptorForClient(descriptor())) {
    const int accepted = ::accept4(descriptor(), nullptr, nullptr, SOCK_NONBLOCK | SOCK_CLOEXEC);
    if (accepted >= 0) return accepted;
    error = errno;
  }
  // Both look for a free descriptor before they look for a client, and so complain where nobody
  // waits, too.
  pollfd waiting{descriptor(), POLLIN, 0};
  const bool outOfDescriptors = error == EMFILE || error == ENFILE;
  return outOfDescriptors && ::poll(&waiting, 1, 0) == 0 ? -EAGAIN : -error;
}

template <class Kind>
void QVBusSocket::wait(Kind kind, QVFunction<void()> handler) {
  descriptor_->waiter.async_wait(
      kind, [handler = std::move(handler)](const asio::error_code& error) mutable {
        if (error != asio::error::operation_aborted) handler();
      });
}

void QVBusSocket::waitReadable(QVFunction<void()> handler) {
  wait(asio::posix::stream_descriptor::wait_read, std::move(handler));
}

void QVBusSocket::waitWritable(QVFunction<void()> handler) {
  wait(asio::posix::stream_descriptor::wait_write, std::move(handler));
}

void QVBusSocket::waitHangUp(QVFunction<void()> handler) {
  wait(asio::posix::stream_descriptor::wait_error, std::move(handler));
}

bool QVBusSocket::hasHungUp() const {
  pollfd state{descriptor(), 0, 0};
  return ::poll(&state, 1, 0) == 1 && (state.revents & (POLLHUP | POLLERR)) != 0;
}

void QVBusSocket::close() {
  asio::error_code ignored;
  descriptor_->waiter.close(ignored);
}

QVBusSocket::Peer QVBusSocket::peer() const {
  ucred credentials{};
  socklen_t length = sizeof credentials;
  if (::getsockopt(descriptor(), SOL_SOCKET, SO_PEERCRED, &credentials, &length) != 0) return {};
  return {credentials.pid, credentials.uid};
}
