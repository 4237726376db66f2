#pragma once

#include "platform/linux/QVDescriptor.h"

#include <filesystem>

// Says when the store's files change: the database, its write-ahead log, or another store in their
// place. The kernel tells (inotify); nothing is asked for again and again.
//
// Threads: one. Failures: QVToolFailure where the store's directory cannot be watched.
class QVStoreWatch {
 public:
  explicit QVStoreWatch(const std::filesystem::path& store);

  // Readable when something has changed.
  int descriptor() const { return descriptor_.get(); }
  // Forgets what was told so far.
  void drain() const;

 private:
  QVDescriptor descriptor_;
};
