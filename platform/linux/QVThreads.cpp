#include "platform/linux/QVThreads.h"

#include <algorithm>
#include <csignal>
#include <string>

#include <pthread.h>
#include <sys/resource.h>
#include <unistd.h>

namespace {

constexpr std::size_t kLongestName = 15;  // bytes, of the kernel
constexpr int kNicest = 19;               // of the kernel

}  // namespace

int QVNicenessForQuality(QVQualityOfService quality, int32_t relativePriority) noexcept {
  int niceness = 0;
  switch (quality) {
    case QVQualityOfService::background:
      niceness = 10;
      break;
    case QVQualityOfService::utility:
      niceness = 5;
      break;
    case QVQualityOfService::standard:
      break;
    case QVQualityOfService::userInitiated:
      niceness = -2;
      break;
    case QVQualityOfService::userInteractive:
      niceness = -5;
      break;
  }
  return std::min(niceness - std::clamp(relativePriority, -kNicest, 0), kNicest);
}

void QVPrepareThread(std::string_view name, int niceness) noexcept {
  const std::string shortName(name.substr(0, kLongestName));
  pthread_setname_np(pthread_self(), shortName.c_str());

  // Counted from the main thread's, which the service manager may have set; what a thread inherits
  // is that of whoever made it. On Linux 0 means the calling thread alone. A refusal is as good.
  const int base = getpriority(PRIO_PROCESS, static_cast<id_t>(getpid()));
  static_cast<void>(setpriority(PRIO_PROCESS, 0, std::min(base + niceness, kNicest)));

  // Faults stay with the thread that makes them, profilers reach every thread.
  sigset_t signals;
  sigfillset(&signals);
  for (const int kept : {SIGSEGV, SIGBUS, SIGFPE, SIGILL, SIGABRT, SIGTRAP, SIGPROF}) {
    sigdelset(&signals, kept);
  }
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
}
