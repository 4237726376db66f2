#pragma once

#include <mutex>
#include <string>
#include <vector>

// What a fake notes of calls that break its interface's rules. A test that provokes misuse takes
// the notes; notes that nobody took end the test program when the fake goes, so that a wrong use
// never passes unseen.
//
// Threads: any.
class QVFakeMisuse {
 public:
  explicit QVFakeMisuse(std::string fake) : fake_(std::move(fake)) {}
  ~QVFakeMisuse();
  QVFakeMisuse(const QVFakeMisuse&) = delete;
  QVFakeMisuse& operator=(const QVFakeMisuse&) = delete;

  void note(std::string what);
  // The notes so far; they count as seen.
  std::vector<std::string> take();

 private:
  const std::string fake_;
  std::mutex mutex_;
  std::vector<std::string> notes_;
};
