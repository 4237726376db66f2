#pragma once

#include <condition_variable>
#include <mutex>
#include <string>

// An SQLite file system that fails when told: the usual one in all else. Register one at a time;
// it has to outlive the databases opened with it.
//
// Threads: any.
class QVFaultyFileSystem {
 public:
  enum class Fault {
    none,
    diskFull,   // nothing can be written
    badSectors  // writing and syncing fail
  };

  QVFaultyFileSystem();
  ~QVFaultyFileSystem();
  QVFaultyFileSystem(const QVFaultyFileSystem&) = delete;
  QVFaultyFileSystem& operator=(const QVFaultyFileSystem&) = delete;

  // What databases name it by.
  static std::string name() { return "qv-faulty"; }
  void fail(Fault fault);
  // Waits until something has been written since the last change of the fault; false where that
  // takes longer than a minute.
  [[nodiscard]] bool awaitWrite();

  // For the file system's functions: is writing possible? Notes where it is.
  Fault attemptWrite();

 private:
  std::mutex mutex_;
  std::condition_variable written_;
  // Guarded by mutex_.
  Fault fault_ = Fault::none;
  bool wrote_ = false;
};
