#pragma once

#include <filesystem>

// Waits until somebody else has read a file: opened it to read, and closed it again.
//
// Threads: one at a time.
class QVFileReadings {
 public:
  // The file has to be there.
  explicit QVFileReadings(const std::filesystem::path& file);
  ~QVFileReadings();
  QVFileReadings(const QVFileReadings&) = delete;
  QVFileReadings& operator=(const QVFileReadings&) = delete;

  // Has it been read since it was asked last, or is it within a minute?
  [[nodiscard]] bool await();
  // Has it been read since it was asked last?
  [[nodiscard]] bool haveHappened();

 private:
  bool await(int milliseconds);

  const int descriptor_;
};
