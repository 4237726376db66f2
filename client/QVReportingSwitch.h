#pragma once

#include "platform/linux/QVDescriptor.h"

#include <atomic>
#include <cstddef>
#include <filesystem>
#include <string>
#include <vector>

// Whether reporting is switched off: the service's preference, read as it is made and again
// whenever the service's notification is posted.
//
// The notification is a file of a directory that the service makes; where that is missing, the
// nearest directory above that there is is watched for it. Whenever a watch begins anew the
// preference is read, since a post may have been lost. That a directory above the one that is
// watched was renamed, or a link led elsewhere, lookAgain() finds.
//
// Used by QVReporterCore. Threads: isOff() any, at once; the rest one at a time. Failures: where
// nothing can be watched, as without inotify instances left, lookAgain() alone reads the preference
// again. Where the preference cannot be read for want of descriptors or memory, what is known
// stands until it is next read; where it is missing or in disorder, reporting is on, as for the
// service.
class QVReportingSwitch {
 public:
  QVReportingSwitch(const std::string& configurationDirectory, const std::string& runtimeDirectory);

  bool isOff() const noexcept { return isOff_.load(std::memory_order_relaxed); }

  // Readable when there may be news; -1 where the system had none left.
  int descriptor() const noexcept { return inotify_.get(); }
  // Takes the news in; does not wait.
  void readNews();
  // Watches anew what there is, now that the service runs, and reads the preference.
  void lookAgain();

 private:
  void watch();
  int add(std::size_t level) const;
  void remove(int watch) const;
  bool hearsPosts() const { return level_ == levels_.size(); }
  void readPreference();

  const std::string preferences_;
  const std::vector<std::filesystem::path> levels_;  // from the root to the notifications
  std::atomic<bool> isOff_{false};
  const QVDescriptor inotify_;
  std::size_t level_ = 0;  // levels down to the one that is watched; 0: none is
  int watch_ = -1;
};
