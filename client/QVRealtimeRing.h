#pragma once

#include "client/QVReporterCounters.h"

#include <array>
#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>

struct QVReporterSessionState;

// The slots of a real-time queue, between the thread that fills them and the one that empties them.
// All memory is made, and touched, at the start.
//
// `written_` and `taken_` only grow; a slot belongs to the consumer from the release store of
// `written_` on, to the producer again from that of `taken_` on. Each side keeps the other's number
// as it last saw it, and looks again only when that says full or empty, so that messages cost no
// traffic between the processors but when they are few.
//
// Used by QVRealtimeQueue (producer) and the reporter's thread (consumer). Threads: as marked.
// Ownership: shared by both.
class QVRealtimeRing {
 public:
  struct Message {
    std::span<char> payload;
    uint32_t category = 0;
    uint16_t type = 0;
  };

  // `slots` a power of 2. The session is the consumer's alone.
  QVRealtimeRing(std::size_t slots, std::size_t slotBytes, QVReporterSessionState* owner);

  // The producer's. The next slot's memory, empty where all slots are taken.
  std::span<char> nextSlot() noexcept;
  // Hands over the slot that nextSlot() gave.
  void push(std::size_t bytes, uint32_t category, uint16_t type) noexcept;
  void countDrop(QVDropReason reason) noexcept;
  // It will push no more.
  void abandon() noexcept { abandoned_.store(true, std::memory_order_release); }

  // The consumer's. False where there is no message; one stays where it is until pop().
  bool front(Message& message) noexcept;
  void pop() noexcept;
  bool isAbandoned() const noexcept { return abandoned_.load(std::memory_order_acquire); }

  // Any thread, one at a time. What was dropped since this was last asked.
  QVDropCounts takeDrops() noexcept;

  // The consumer's; null once the session is destroyed.
  QVReporterSessionState* session;

 private:
  struct Slot {
    std::size_t bytes = 0;
    uint32_t category = 0;
    uint16_t type = 0;
  };
  static constexpr std::size_t kCacheLine = 64;

  const std::size_t mask_;
  const std::size_t slotBytes_;
  const std::unique_ptr<Slot[]> slots_;
  const std::unique_ptr<char[]> memory_;

  alignas(kCacheLine) std::atomic<std::size_t> written_{0};
  std::size_t takenSeen_ = 0;  // by the producer
  // Written by the producer alone.
  std::array<std::atomic<uint64_t>, kQVDropReasonCount> drops_{};
  std::atomic<bool> abandoned_{false};

  alignas(kCacheLine) std::atomic<std::size_t> taken_{0};
  std::size_t writtenSeen_ = 0;  // by the consumer
  QVDropCounts dropsTaken_;      // by takeDrops()
};
