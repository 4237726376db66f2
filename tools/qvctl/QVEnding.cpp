#include "tools/qvctl/QVEnding.h"

#include "tools/qvctl/QVSignals.h"
#include "tools/qvctl/QVToolFailure.h"

#include <algorithm>
#include <array>
#include <cerrno>

#include <sys/time.h>
#include <unistd.h>

namespace {

constexpr std::array<int, 3> kRequests{SIGINT, SIGTERM, SIGHUP};

volatile std::sig_atomic_t asked = 0;

// Every call in it may be made from a signal handler. Being asked again, as timeout(1) does it,
// leaves the grace as it is.
void take(int number) {
  if (asked != 0) {
    if (number == SIGALRM) ::_exit(static_cast<int>(QVToolStatus::done));
    return;
  }
  asked = 1;
  ::alarm(static_cast<unsigned>(QVEnding::kGrace.count()));
}

// Not restarting: what waits has to see that it is asked.
void handle(int number, void (*handler)(int)) {
  struct sigaction action {};
  action.sa_handler = handler;
  ::sigemptyset(&action.sa_mask);
  ::sigaction(number, &action, nullptr);
}

void armAfter(std::chrono::microseconds duration) {
  constexpr int64_t kPerSecond = 1'000'000;
  // Nothing at all would be no timer.
  const int64_t count = std::max<int64_t>(duration.count(), 1);
  itimerval timer{};
  timer.it_value.tv_sec = count / kPerSecond;
  timer.it_value.tv_usec = count % kPerSecond;
  if (::setitimer(ITIMER_REAL, &timer, nullptr) != 0) throw QVToolFailure::ofSystem("timer", errno);
}

}  // namespace

QVEnding::QVEnding(std::optional<std::chrono::microseconds> duration) {
  ::sigemptyset(&taken_);
  ::sigaddset(&taken_, SIGALRM);
  handle(SIGALRM, take);
  for (const int number : kRequests) {
    if (QVSignals::isIgnored(number)) continue;
    ::sigaddset(&taken_, number);
    handle(number, take);
  }
  // Whoever started this process may have blocked them.
  ::pthread_sigmask(SIG_UNBLOCK, &taken_, nullptr);
  if (duration) armAfter(*duration);
}

bool QVEnding::isAsked() {
  return asked != 0;
}

int QVEnding::poll(std::span<pollfd> entries, int milliseconds) const {
  // Between the question and the waiting no signal may come unseen.
  sigset_t previous;
  ::pthread_sigmask(SIG_BLOCK, &taken_, &previous);
  const timespec limit{milliseconds / 1000, (milliseconds % 1000) * 1'000'000L};
  int ready = -1;
  int error = EINTR;
  if (!isAsked()) {
    ready = ::ppoll(entries.data(), entries.size(), milliseconds < 0 ? nullptr : &limit, &previous);
    error = errno;
  }
  ::pthread_sigmask(SIG_SETMASK, &previous, nullptr);
  errno = error;
  return ready;
}
