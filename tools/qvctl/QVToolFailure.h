#pragma once

#include <filesystem>
#include <stdexcept>
#include <string>

// How qvctl ends. The numbers are documented; scripts rely on them.
enum class QVToolStatus : int {
  done = 0,
  failed = 1,
  wrongUsage = 2,
  notRunning = 3,   // the service is not running, or cannot be reached
  notPermitted = 4  // the system refuses this user
};

// Why a command cannot be carried out: its text goes to standard error, its status is how qvctl
// ends. Thrown by commands and what they use, caught in main.cpp alone.
//
// Threads: as any value.
class QVToolFailure : public std::runtime_error {
 public:
  QVToolFailure(QVToolStatus status, const std::string& text)
      : std::runtime_error(text), status_(status) {}

  // The failure of a system call on `path`, `number` its error number: notPermitted where that is
  // what the system says, else `status`.
  static QVToolFailure ofSystem(const std::string& path, int number,
                                QVToolStatus status = QVToolStatus::failed);

  // The same on a file, which this user wanted to `access()` with that mode (R_OK | W_OK | X_OK):
  // where it is the file's permissions that refuse, the text says who may.
  static QVToolFailure ofFile(const std::filesystem::path& path, int mode, int number,
                              QVToolStatus status = QVToolStatus::failed);

  QVToolStatus status() const noexcept { return status_; }

 private:
  QVToolStatus status_;
};
