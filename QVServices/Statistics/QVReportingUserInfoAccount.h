#pragma once

#include "platform/QVMemoryCharge.h"

#include <atomic>
#include <cstddef>

// What the user information of all sessions takes together. It stays as long as its session does,
// so it is not counted as a message on its way is: a client that may not be read for what its
// sessions keep could not end them either.
//
// Threads: any. Outlives whatever is charged to it.
class QVReportingUserInfoAccount final : public QVMemoryCharge {
 public:
  // Bytes: of more sessions than a device has programs, each with a configuration of the usual
  // size.
  static constexpr std::size_t kMaximumBytes = std::size_t{256} << 20;

  explicit constexpr QVReportingUserInfoAccount(std::size_t maximumBytes = kMaximumBytes) noexcept
      : maximumBytes_(maximumBytes) {}
  QVReportingUserInfoAccount(const QVReportingUserInfoAccount&) = delete;
  QVReportingUserInfoAccount& operator=(const QVReportingUserInfoAccount&) = delete;

  // The process's.
  static QVReportingUserInfoAccount& shared() noexcept {
    static constinit QVReportingUserInfoAccount account;
    return account;
  }

  void add(std::size_t bytes) noexcept override { bytes_ += bytes; }
  void remove(std::size_t bytes) noexcept override { bytes_ -= bytes; }

  bool isOverdrawn() const noexcept { return bytes_ > maximumBytes_; }

 private:
  const std::size_t maximumBytes_;
  std::atomic<std::size_t> bytes_{0};
};
