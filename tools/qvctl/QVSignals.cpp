#include "tools/qvctl/QVSignals.h"

#include "tools/qvctl/QVToolFailure.h"

#include <cerrno>

QVSignals::QVSignals(std::initializer_list<int> signals) {
  sigset_t set;
  ::sigemptyset(&set);
  for (const int number : signals) {
    if (!isIgnored(number)) ::sigaddset(&set, number);
  }
  ::pthread_sigmask(SIG_BLOCK, &set, &previous_);
  descriptor_ = QVDescriptor(::signalfd(-1, &set, SFD_CLOEXEC | SFD_NONBLOCK));
  if (!descriptor_.isOpen()) throw QVToolFailure::ofSystem("signals", errno);
}

bool QVSignals::isIgnored(int number) {
  struct sigaction action {};
  return ::sigaction(number, nullptr, &action) == 0 && action.sa_handler == SIG_IGN;
}

std::optional<signalfd_siginfo> QVSignals::next() const {
  signalfd_siginfo information{};
  if (::read(descriptor_.get(), &information, sizeof information) != sizeof information) {
    return std::nullopt;
  }
  return information;
}
