#include "tests/support/QVRawPeer.h"

#include "platform/QVText.h"
#include "platform/linux/bus/QVBusAuthClient.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <stdexcept>
#include <system_error>
#include <utility>

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

namespace {

// Milliseconds until a test that waits for the service gives up.
constexpr int kLimit = 60'000;

int connectTo(const std::filesystem::path& path) {
  const int descriptor = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  sockaddr_un address{.sun_family = AF_UNIX, .sun_path = {}};
  path.string().copy(address.sun_path, sizeof address.sun_path - 1);
  if (::connect(descriptor, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    const int error = errno;
    ::close(descriptor);
    throw std::runtime_error(
        QVText("cannot connect to ", path.string(), ": ", std::generic_category().message(error)));
  }
  return descriptor;
}

void awaitEvent(int descriptor, short event) {
  pollfd wanted{descriptor, event, 0};
  if (::poll(&wanted, 1, kLimit) != 1) throw std::runtime_error("the service does not react");
}

bool isClosed(int error) {
  return error == EPIPE || error == ECONNRESET;
}

}  // namespace

QVRawPeer::QVRawPeer(const std::filesystem::path& socket, Opening opening)
    : descriptor_(connectTo(socket)) {
  if (opening == Opening::silent) return;
  send(QVRawPeer::opening());
  const auto answer = receiveLine();
  if (!answer.starts_with("OK ")) throw std::runtime_error("not let in: " + answer);
}

std::string QVRawPeer::opening() {
  return QVBusAuthClient::opening(::getuid());
}

bool QVRawPeer::send(std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t sent =
        ::send(descriptor_, bytes.data(), bytes.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
    if (sent >= 0) {
      bytes.remove_prefix(static_cast<std::size_t>(sent));
    } else if (isClosed(errno)) {
      return false;
    } else {
      awaitEvent(descriptor_, POLLOUT);
    }
  }
  return true;
}

std::size_t QVRawPeer::sendWithoutWaiting(std::string_view bytes) {
  const ssize_t sent = ::send(descriptor_, bytes.data(), bytes.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
  return sent > 0 ? static_cast<std::size_t>(sent) : 0;
}

bool QVRawPeer::sendWithDescriptor(std::string_view bytes, int descriptor) {
  iovec data{const_cast<char*>(bytes.data()), bytes.size()};
  alignas(cmsghdr) char control[CMSG_SPACE(sizeof descriptor)] = {};
  msghdr message{};
  message.msg_iov = &data;
  message.msg_iovlen = 1;
  message.msg_control = control;
  message.msg_controllen = sizeof control;
  cmsghdr* header = CMSG_FIRSTHDR(&message);
  header->cmsg_level = SOL_SOCKET;
  header->cmsg_type = SCM_RIGHTS;
  header->cmsg_len = CMSG_LEN(sizeof descriptor);
  std::memcpy(CMSG_DATA(header), &descriptor, sizeof descriptor);
  const ssize_t sent = ::sendmsg(descriptor_, &message, MSG_NOSIGNAL);
  return sent == static_cast<ssize_t>(bytes.size());
}

void QVRawPeer::finishSending() const {
  ::shutdown(descriptor_, SHUT_WR);
}

void QVRawPeer::close() {
  if (descriptor_ >= 0) ::close(std::exchange(descriptor_, -1));
}

// Waits for bytes; false where the service has closed the connection.
bool QVRawPeer::receiveBytes() {
  awaitEvent(descriptor_, POLLIN);
  char buffer[65536];
  const ssize_t received = ::recv(descriptor_, buffer, sizeof buffer, 0);
  if (received > 0) bytes_.append(buffer, static_cast<std::size_t>(received));
  return received > 0;
}

std::string QVRawPeer::receiveLine() {
  std::size_t end = bytes_.find("\r\n");
  while (end == std::string::npos) {
    if (!receiveBytes()) return {};
    end = bytes_.find("\r\n");
  }
  const std::string line = bytes_.substr(0, end);
  bytes_.erase(0, end + 2);
  return line;
}

std::optional<QVPeerMessage> QVRawPeer::receive() {
  for (;;) {
    std::string_view message;
    switch (decoder_.next(message)) {
      case QVBusFrameDecoder::Result::message:
        return QVPeerMessage::fromBytes(message);
      case QVBusFrameDecoder::Result::malformed:
        throw std::runtime_error(QVText("the service sent: ", decoder_.failure()));
      case QVBusFrameDecoder::Result::needsMore:
        break;
    }
    if (bytes_.empty() && !receiveBytes()) return std::nullopt;
    fed_ = std::exchange(bytes_, {});
    decoder_.feed(fed_);
  }
}

void QVRawPeer::awaitClose() {
  while (receiveBytes()) bytes_.clear();
}

uint32_t QVRawPeer::post(const QVPeerCall& call) {
  const uint32_t serial = nextSerial();
  send(call.bytes(serial));
  return serial;
}

std::optional<QVPeerMessage> QVRawPeer::takeReply(uint32_t serial) {
  const auto found = std::ranges::find(kept_, serial, &QVPeerMessage::replySerial);
  if (found == kept_.end()) return std::nullopt;
  std::optional reply(std::move(*found));
  kept_.erase(found);
  return reply;
}

QVPeerMessage QVRawPeer::awaitReply(uint32_t serial) {
  if (auto reply = takeReply(serial)) return std::move(*reply);
  while (auto message = receive()) {
    if (message->replySerial == serial) return std::move(*message);
    kept_.push_back(std::move(*message));
  }
  throw std::runtime_error("the service closed the connection instead of answering");
}
