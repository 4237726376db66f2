#include "platform/linux/bus/QVBusListeningSocket.h"

#include "platform/linux/QVDescriptor.h"

#include <cerrno>
#include <cstring>
#include <system_error>
#include <utility>

#include <fcntl.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <systemd/sd-daemon.h>
#include <unistd.h>

namespace {

constexpr mode_t kSocketMode = 0660;

// Connections that may wait to be accepted; the kernel caps it at its own limit.
constexpr int kBacklog = 512;

std::string withReason(const std::string& text, int number = errno) {
  return text + ": " + std::generic_category().message(number);
}

int makeSocket() {
  return ::socket(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0);
}

std::string directoryOf(const std::string& path) {
  const std::size_t slash = path.rfind('/');
  if (slash == std::string::npos) return ".";
  return slash == 0 ? "/" : path.substr(0, slash);
}

// Makes `path` free to be bound; false where it is somebody's.
bool clearPath(const std::string& path, const sockaddr_un& address, std::string& error) {
  struct stat status {};
  if (::lstat(path.c_str(), &status) != 0) {
    if (errno == ENOENT) return true;
    error = withReason("cannot look at " + path);
    return false;
  }
  if (!S_ISSOCK(status.st_mode)) {
    error = path + " is no socket; it is left alone";
    return false;
  }
  const QVDescriptor probe(makeSocket());
  // EAGAIN: somebody listens and is busy.
  if (::connect(probe.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0 ||
      errno == EAGAIN) {
    error = "a running service listens at " + path;
    return false;
  }
  if (errno != ECONNREFUSED) {
    error = withReason("cannot tell whether a service listens at " + path);
    return false;
  }
  if (::unlink(path.c_str()) != 0 && errno != ENOENT) {
    error = withReason("cannot remove the stale socket " + path);
    return false;
  }
  return true;
}

}  // namespace

std::unique_ptr<QVBusListeningSocket> QVBusListeningSocket::open(const std::string& path,
                                                                 std::string& error) {
  // Clears the variables, so that no child takes the sockets for its own.
  const int inherited = ::sd_listen_fds(1);
  if (inherited != 0) return inherit(inherited, error);
  return bind(path, error);
}

std::unique_ptr<QVBusListeningSocket> QVBusListeningSocket::inherit(int count, std::string& error) {
  if (count < 0) {
    error = withReason("cannot take over the service manager's socket", -count);
    return nullptr;
  }
  if (count > 1) {
    error = "the service manager hands over " + std::to_string(count) + " sockets instead of one";
    return nullptr;
  }
  const int descriptor = SD_LISTEN_FDS_START;
  if (::sd_is_socket_unix(descriptor, SOCK_STREAM, 1, nullptr, 0) <= 0) {
    error = "the service manager's socket is no listening unix stream socket";
    return nullptr;
  }
  const int flags = ::fcntl(descriptor, F_GETFL);
  if (flags < 0 || ::fcntl(descriptor, F_SETFL, flags | O_NONBLOCK) < 0) {
    error = withReason("cannot set up the service manager's socket");
    return nullptr;
  }
  return std::unique_ptr<QVBusListeningSocket>(new QVBusListeningSocket(descriptor));
}

std::unique_ptr<QVBusListeningSocket> QVBusListeningSocket::bind(const std::string& path,
                                                                 std::string& error) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (path.empty() || path.size() >= sizeof address.sun_path) {
    error = "the socket's path \"" + path + "\" is empty or longer than " +
            std::to_string(sizeof address.sun_path - 1) + " bytes";
    return nullptr;
  }
  std::memcpy(address.sun_path, path.data(), path.size());

  // Between the look at the path and our own listening nobody else of us may do the same.
  const auto directoryPath = directoryOf(path);
  const QVDescriptor directory(::open(directoryPath.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!directory.isOpen() || ::flock(directory.get(), LOCK_EX) != 0) {
    error = withReason("cannot use the directory " + directoryPath);
    return nullptr;
  }
  if (!clearPath(path, address, error)) return nullptr;

  std::unique_ptr<QVBusListeningSocket> socket(new QVBusListeningSocket(makeSocket()));
  const int descriptor = socket->descriptor_;
  // The mode before the bind keeps others out from the first moment; the one after it gives back
  // what the umask took.
  struct stat status {};
  if (descriptor < 0 || ::fchmod(descriptor, kSocketMode) != 0 ||
      ::bind(descriptor, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    error = withReason("cannot make the socket " + path);
    return nullptr;
  }
  if (::chmod(path.c_str(), kSocketMode) != 0 || ::lstat(path.c_str(), &status) != 0 ||
      ::listen(descriptor, kBacklog) != 0) {
    error = withReason("cannot listen at " + path);
    ::unlink(path.c_str());
    return nullptr;
  }
  socket->path_ = path;
  socket->device_ = status.st_dev;
  socket->inode_ = status.st_ino;
  return socket;
}

QVBusListeningSocket::~QVBusListeningSocket() {
  if (descriptor_ >= 0) ::close(descriptor_);
}

int QVBusListeningSocket::takeDescriptor() noexcept {
  return std::exchange(descriptor_, -1);
}

void QVBusListeningSocket::unlink() noexcept {
  if (path_.empty()) return;
  struct stat status {};
  if (::lstat(path_.c_str(), &status) == 0 && status.st_dev == device_ && status.st_ino == inode_) {
    ::unlink(path_.c_str());
  }
  path_.clear();
}
