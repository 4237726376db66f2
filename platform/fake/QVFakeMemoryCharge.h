#pragma once

#include "platform/QVMemoryCharge.h"
#include "platform/QVText.h"
#include "platform/fake/QVFakeAbort.h"

#include <atomic>

// Adds up what is charged to it. To remove more than was added, or to end it before everything was
// removed, is a mistake and ends the program. Threads: any, at once.
class QVFakeMemoryCharge final : public QVMemoryCharge {
 public:
  QVFakeMemoryCharge() = default;
  ~QVFakeMemoryCharge() {
    if (held() != 0) QVFakeAbort(QVText("QVFakeMemoryCharge: ended with ", held(), " bytes"));
  }
  QVFakeMemoryCharge(const QVFakeMemoryCharge&) = delete;
  QVFakeMemoryCharge& operator=(const QVFakeMemoryCharge&) = delete;

  void add(std::size_t bytes) noexcept override { held_ += bytes; }
  void remove(std::size_t bytes) noexcept override {
    const std::size_t before = held_.fetch_sub(bytes);
    if (before < bytes) {
      QVFakeAbort(QVText("QVFakeMemoryCharge: ", bytes, " bytes removed of ", before));
    }
  }

  std::size_t held() const { return held_; }

 private:
  std::atomic<std::size_t> held_{0};
};
