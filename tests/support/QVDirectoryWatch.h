#pragma once

#include <filesystem>
#include <functional>

// Waits for something that shows in the files of a directory: whenever one of them is written,
// made, moved or removed, the condition is asked again.
//
// Threads: one at a time.
class QVDirectoryWatch {
 public:
  explicit QVDirectoryWatch(const std::filesystem::path& directory);
  ~QVDirectoryWatch();
  QVDirectoryWatch(const QVDirectoryWatch&) = delete;
  QVDirectoryWatch& operator=(const QVDirectoryWatch&) = delete;

  // False where the condition has not come to hold within a minute.
  [[nodiscard]] bool await(const std::function<bool()>& condition) const;

 private:
  int descriptor_;
};
