#include "tests/support/QVTerminal.h"

#include <array>
#include <cerrno>
#include <csignal>
#include <stdexcept>

#include <poll.h>
#include <pty.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

constexpr int kLimitMilliseconds = 60'000;

}  // namespace

QVTerminal::QVTerminal(const Options& options) {
  const winsize size{
      .ws_row = options.rows, .ws_col = options.columns, .ws_xpixel = 0, .ws_ypixel = 0};
  pid_ = ::forkpty(&terminal_, nullptr, nullptr, &size);
  if (pid_ < 0) throw std::runtime_error("cannot make a terminal");
  if (pid_ == 0) QVSubprocess::execute(options.arguments, options.environment);
}

QVTerminal::~QVTerminal() {
  if (!status_) {
    ::kill(pid_, SIGKILL);
    ::waitpid(pid_, nullptr, 0);
  }
  ::close(terminal_);
}

void QVTerminal::signal(int number) const {
  if (!status_) ::kill(pid_, number);
}

void QVTerminal::type(std::string_view text) const {
  if (::write(terminal_, text.data(), text.size()) != static_cast<ssize_t>(text.size())) {
    throw std::runtime_error("cannot type");
  }
}

bool QVTerminal::read() {
  pollfd entry{terminal_, POLLIN, 0};
  if (::poll(&entry, 1, kLimitMilliseconds) != 1) return false;
  std::array<char, 4096> bytes;
  const ssize_t count = ::read(terminal_, bytes.data(), bytes.size());
  // Once nobody has the other end open any more, reading fails.
  if (count <= 0) return count < 0 && errno == EINTR;
  shown_.append(bytes.data(), static_cast<std::size_t>(count));
  return true;
}

bool QVTerminal::await(std::string_view text) {
  while (shown_.find(text) == std::string::npos) {
    if (!read()) return false;
  }
  return true;
}

std::optional<QVSubprocess::Status> QVTerminal::wait() {
  if (status_) return status_;
  while (read()) {
  }
  // It has closed its terminal, which it does last of all; else it has had its minute.
  const int process = static_cast<int>(::syscall(SYS_pidfd_open, pid_, 0));
  pollfd entry{process, POLLIN, 0};
  const int ended = ::poll(&entry, 1, kLimitMilliseconds);
  ::close(process);
  if (ended != 1) return std::nullopt;
  int raw = 0;
  const pid_t collected = ::waitpid(pid_, &raw, 0);
  if (collected != pid_) return std::nullopt;
  status_ = QVSubprocess::statusOf(raw);
  return status_;
}
