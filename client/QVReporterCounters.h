#pragma once

#include <array>
#include <cstddef>
#include <cstdint>

// Why a message did not reach the service.
enum class QVDropReason : uint8_t {
  queueFull,       // the service did not keep up: the bound on what waits for it was reached
  disabled,        // reporting is switched off
  connectionLost,  // it was under way when the connection was lost, its session was lost with the
                   // connection or destroyed, or the reporter ended before the service took it
  refused,         // the service answered with an error
  invalid          // its payload is not in order, or larger than a message may be
};
inline constexpr std::size_t kQVDropReasonCount = 5;

// How many messages were dropped, by reason. A value.
struct QVDropCounts {
  std::array<uint64_t, kQVDropReasonCount> counts{};

  uint64_t of(QVDropReason reason) const noexcept {
    return counts[static_cast<std::size_t>(reason)];
  }
  uint64_t inAll() const noexcept {
    uint64_t sum = 0;
    for (const uint64_t count : counts) sum += count;
    return sum;
  }
  QVDropCounts& operator+=(const QVDropCounts& more) noexcept {
    for (std::size_t i = 0; i < kQVDropReasonCount; ++i) counts[i] += more.counts[i];
    return *this;
  }
};

// What became of a reporter's messages since it was opened. A value. Messages that are under way,
// at most 256 or 256 KiB, and what lies in real-time queues are in none of its numbers yet; behind
// a flush there are none of the former.
struct QVReporterCounters {
  uint64_t sent = 0;  // the service has taken them
  QVDropCounts dropped{};
  uint64_t connections = 0;  // made to the service, the first one included
  std::size_t queuedMessages =
      0;  // in the queue at this moment, calls that control sessions included
  std::size_t queuedBytes = 0;
};
