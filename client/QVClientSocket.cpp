#include "client/QVClientSocket.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <system_error>

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>

namespace {

QVClientError cannotConnect(const std::string& path, const std::string& reason) {
  return {QVClientError::Code::cannotConnect, path + ": " + reason};
}

void setSendTimeLimit(int socket, std::chrono::milliseconds limit) {
  // None at all would mean for ever.
  limit = std::max(limit, std::chrono::milliseconds(1));
  const auto seconds = std::chrono::duration_cast<std::chrono::seconds>(limit);
  const auto rest = std::chrono::duration_cast<std::chrono::microseconds>(limit - seconds);
  const timeval time{.tv_sec = seconds.count(), .tv_usec = rest.count()};
  // Where it cannot be set, connecting waits for as long as the service's queue of clients is full.
  static_cast<void>(setsockopt(socket, SOL_SOCKET, SO_SNDTIMEO, &time, sizeof time));
}

}  // namespace

std::string QVClientSystemErrorText(int number) {
  return std::generic_category().message(number);
}

std::string QVClientSocketPath(const QVClientOptions& options) {
  if (!options.socketPath.empty()) return options.socketPath;
  // A program with more rights than its caller does not let the caller choose.
  const char* fromEnvironment = secure_getenv(kQVClientSocketVariable);
  const bool named = fromEnvironment != nullptr && *fromEnvironment != '\0';
  return named ? fromEnvironment : kQVClientDefaultSocketPath;
}

QVClientResult<QVDescriptor> QVClientConnectSocket(const QVClientOptions& options) {
  const std::string path = QVClientSocketPath(options);
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (path.size() >= sizeof address.sun_path) return cannotConnect(path, "path too long");
  std::copy(path.begin(), path.end(), address.sun_path);

  QVDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  if (!socket.isOpen()) return cannotConnect(path, QVClientSystemErrorText(errno));
  setSendTimeLimit(socket.get(), options.connectTimeLimit);
  int result = -1;
  do {
    result = connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address);
  } while (result != 0 && errno == EINTR);
  if (result != 0) {
    const bool waited = errno == EAGAIN;
    return cannotConnect(
        path, waited ? "the service does not accept clients" : QVClientSystemErrorText(errno));
  }
  if (!QVClientPrepareSocket(socket.get())) {
    return cannotConnect(path, QVClientSystemErrorText(errno));
  }
  return socket;
}

bool QVClientPrepareSocket(int socket) {
  const int flags = fcntl(socket, F_GETFL);
  return flags >= 0 && fcntl(socket, F_SETFL, flags | O_NONBLOCK) == 0 &&
         fcntl(socket, F_SETFD, FD_CLOEXEC) == 0;
}

QVClientTransfer QVClientSend(int socket, const char* bytes, std::size_t count) {
  std::size_t sent = 0;
  while (sent < count) {
    const ssize_t result = send(socket, bytes + sent, count - sent, MSG_DONTWAIT | MSG_NOSIGNAL);
    if (result >= 0) {
      sent += static_cast<std::size_t>(result);
    } else if (errno == EAGAIN || errno == EWOULDBLOCK) {
      return {QVClientTransfer::State::wouldBlock, sent};
    } else if (errno != EINTR) {
      return {QVClientTransfer::State::failed, sent};
    }
  }
  return {QVClientTransfer::State::done, sent};
}

QVClientTransfer QVClientReceive(int socket, char* bytes, std::size_t count) {
  ssize_t result = -1;
  do {
    result = recv(socket, bytes, count, MSG_DONTWAIT);
  } while (result < 0 && errno == EINTR);
  if (result >= 0) return {QVClientTransfer::State::done, static_cast<std::size_t>(result)};
  const bool wouldBlock = errno == EAGAIN || errno == EWOULDBLOCK;
  return {wouldBlock ? QVClientTransfer::State::wouldBlock : QVClientTransfer::State::failed, 0};
}
