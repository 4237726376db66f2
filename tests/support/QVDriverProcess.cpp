#include "tests/support/QVDriverProcess.h"

#include "tests/support/QVDaemonProcess.h"

#include <array>
#include <stdexcept>

#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

QVDriverProcess::QVDriverProcess(const std::string& file, const std::vector<std::string>& options) {
  std::array<int, 2> ends{};
  if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()) != 0) {
    throw std::runtime_error("cannot make a pair of sockets");
  }
  socket_ = ends[0];
  std::vector<std::string> arguments{"sh", "-c", "exec \"$0\" \"$@\" <&3 >&3 3>&-",
                                     QVDaemonProcess::program("qv-driver").string(), "--on-input"};
  arguments.insert(arguments.end(), options.begin(), options.end());
  arguments.push_back(file);
  process_.emplace(QVSubprocess::Options{.arguments = arguments, .inheritedDescriptor = ends[1]});
  ::close(ends[1]);
  if (nextLine() != "published") throw std::runtime_error("the driver does not publish " + file);
}

QVDriverProcess::~QVDriverProcess() {
  ::close(socket_);
}

void QVDriverProcess::count() {
  if (::send(socket_, "\n", 1, MSG_NOSIGNAL) != 1 || nextLine().empty()) {
    throw std::runtime_error("the driver does not count");
  }
}

std::optional<QVSubprocess::Status> QVDriverProcess::end() {
  ::shutdown(socket_, SHUT_WR);
  return wait();
}

std::string QVDriverProcess::nextLine() const {
  constexpr int kLimitMilliseconds = 60'000;
  std::string line;
  char byte = 0;
  pollfd readable{socket_, POLLIN, 0};
  while (::poll(&readable, 1, kLimitMilliseconds) == 1 && ::read(socket_, &byte, 1) == 1) {
    if (byte == '\n') return line;
    line.push_back(byte);
  }
  return {};
}
