#pragma once

#include "platform/QVLog.h"
#include "platform/linux/QVBell.h"
#include "platform/linux/orientation/QVOrientationRegistrations.h"
#include "platform/linux/watch/QVDirectoryWatcher.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <memory>

// The user interface's orientation, a word in a file, blanks around it ignored. The file is watched
// and read only while somebody is registered. The registrations have a reading of it as their
// baseline (valueIn); the thread watches the file after that, and then reads it itself, so that a
// change in between is told.
//
// A file that is missing, no regular file, or of other contents is "undefined". One that is empty
// is about to be written: what it said before holds.
//
// Made and worked by QVLinuxOrientation, on its thread, which sleeps until `bell` rings; valueIn()
// on any. Nothing here waits. The registrations outlive it.
// Failures: a directory that cannot be watched is one error line each time demand begins.
class QVFileOrientation {
 public:
  // Far above the longest word with its line end.
  static constexpr std::size_t kMaximumBytes = 64;

  QVFileOrientation(QVLog& log, std::shared_ptr<QVDirectoryWatcher> watcher,
                    std::filesystem::path file, std::shared_ptr<const QVBell> bell,
                    QVOrientationRegistrations& registrations);
  ~QVFileOrientation();
  QVFileOrientation(const QVFileOrientation&) = delete;
  QVFileOrientation& operator=(const QVFileOrientation&) = delete;

  // Follows the demand, and reads the file if it has changed.
  void work();

  // What the file says, where nothing is known of it yet.
  static int32_t valueIn(const std::filesystem::path& file);

 private:
  // Shared with the watch, whose callback may run a last time after this is gone.
  struct Changes {
    std::shared_ptr<const QVBell> bell;
    std::atomic<bool> isPending{false};
  };

  void beginWatch();
  void endWatch();

  QVLog& log_;
  const std::shared_ptr<QVDirectoryWatcher> watcher_;
  const std::filesystem::path file_;
  const std::shared_ptr<Changes> changes_;
  QVOrientationRegistrations& registrations_;
  QVOrientationRegistrations::Period period_ = QVOrientationRegistrations::kNoDemand;
  QVDirectoryWatcher::Token watch_ = QVDirectoryWatcher::kNoToken;
};
