#pragma once

#include "platform/linux/QVDescriptor.h"

#include <atomic>
#include <string>

// Whether reporting is switched off: the service's preference, read as it is made and again
// whenever the service's notification is posted.
//
// The notification is a file of a directory that the service makes; where that is missing, the
// directory above is watched for it, and where that is missing too, lookAgain() finds it later.
// Whenever a watch begins anew the preference is read, since a post may have been lost.
//
// Used by QVReporterCore. Threads: isOff() any, at once; the rest one at a time. Failures: where
// nothing can be watched, the preference is what it was at the last reading.
class QVReportingSwitch {
 public:
  QVReportingSwitch(const std::string& configurationDirectory, std::string runtimeDirectory);

  bool isOff() const noexcept { return isOff_.load(std::memory_order_relaxed); }

  // Readable when there may be news; -1 where the system had no descriptor left.
  int descriptor() const noexcept { return inotify_.get(); }
  // Takes the news in; does not wait.
  void readNews();
  // Watches what it could not before, now that the service runs.
  void lookAgain();

 private:
  enum class Watched { nothing, runtimeDirectory, notifications };

  void watch();
  int add(const std::string& directory) const;
  void readPreference();

  const std::string preferences_;
  const std::string runtimeDirectory_;
  std::atomic<bool> isOff_{false};
  const QVDescriptor inotify_;
  Watched watched_ = Watched::nothing;
  int watch_ = -1;
};
