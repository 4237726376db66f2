#pragma once

#include <filesystem>
#include <string>

// A directory of its own for one service, with the places that a service manager would hand over;
// removed with everything in it when the object goes.
class QVTemporaryRoot {
 public:
  QVTemporaryRoot();
  ~QVTemporaryRoot();
  QVTemporaryRoot(const QVTemporaryRoot&) = delete;
  QVTemporaryRoot& operator=(const QVTemporaryRoot&) = delete;

  const std::filesystem::path& path() const { return path_; }
  std::filesystem::path runtime() const { return path_ / "run"; }
  std::filesystem::path state() const { return path_ / "state"; }
  std::filesystem::path logs() const { return path_ / "logs"; }
  std::filesystem::path configuration() const { return path_ / "etc"; }
  std::filesystem::path socket() const { return runtime() / "reporting.socket"; }
  std::filesystem::path store() const { return state() / "reporting.db"; }
  // What a service that a test runs here writes to its standard error.
  std::filesystem::path log() const { return path_ / "log"; }

  // Writes a file below the configuration directory, making folders as needed.
  void configure(const std::filesystem::path& file, const std::string& text) const;

 private:
  std::filesystem::path path_;
};
