#pragma once

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
//   open --refuse()--> refusing --admit()--> open
//     '--close()--> closed
//
// In both of the latter nothing more is taken in; what was pushed before is still there. The bits
// that say so lie in `written_` itself, so that a message is either seen by the consumer or refused
// to the producer, whatever the two do at once.
//
// Used by QVRealtimeQueue (producer) and the reporter's thread (consumer). Threads: as marked.
// Ownership: shared by both.
class QVRealtimeRing {
 private:
  struct Slot {
    std::size_t bytes = 0;
    uint32_t category = 0;
    uint16_t type = 0;
  };

 public:
  struct Message {
    std::span<char> payload;
    uint32_t category = 0;
    uint16_t type = 0;
  };

  // Bytes of memory that a ring takes, but for its members.
  static constexpr std::size_t bytesOf(std::size_t slots, std::size_t slotBytes) {
    return slots * (slotBytes + sizeof(Slot));
  }
  // `slots` a power of 2. The session is the consumer's alone.
  QVRealtimeRing(std::size_t slots, std::size_t slotBytes, QVReporterSessionState* ofSession);

  // The producer's. The next slot's memory, empty where all slots are taken.
  std::span<char> nextSlot() noexcept;
  // Hands over the slot that nextSlot() gave; false where it takes nothing in.
  bool push(std::size_t bytes, uint32_t category, uint16_t type) noexcept;
  // It will push no more.
  void abandon() noexcept { abandoned_.store(true, std::memory_order_release); }

  // The consumer's. False where there is no message; one stays where it is until pop().
  bool front(Message& message) noexcept;
  void pop() noexcept;
  // Takes in no more, or not until admit().
  void close() noexcept { written_.fetch_or(kClosed, std::memory_order_acq_rel); }
  void refuse() noexcept { written_.fetch_or(kRefusing, std::memory_order_acq_rel); }

  // Any thread.
  void admit() noexcept { written_.fetch_and(~kRefusing, std::memory_order_acq_rel); }
  bool isClosed() const noexcept {
    return (written_.load(std::memory_order_relaxed) & kClosed) != 0;
  }
  bool takesIn() const noexcept {
    return (written_.load(std::memory_order_relaxed) & (kClosed | kRefusing)) == 0;
  }
  // No messages are in it, and none will be.
  bool isOver() const noexcept;
  // How many messages were ever pushed, and popped.
  uint64_t written() const noexcept {
    return written_.load(std::memory_order_acquire) & ~(kClosed | kRefusing);
  }
  uint64_t taken() const noexcept { return taken_.load(std::memory_order_acquire); }
  std::size_t bytes() const noexcept { return bytesOf(mask_ + 1, slotBytes_); }

  // Whose it was made for: a name, by which any thread may know it.
  const QVReporterSessionState* const owner;
  // The consumer's, as the next two; null once the session is destroyed.
  QVReporterSessionState* session;
  // How many messages were pushed before the step of the session, and the flush or the end, that is
  // being worked off: these it waits for, not for those that come meanwhile.
  uint64_t writtenBeforeStep = 0;
  uint64_t writtenBeforeFlush = 0;

 private:
  static constexpr std::size_t kCacheLine = 64;
  static constexpr uint64_t kClosed = uint64_t{1} << 63;
  static constexpr uint64_t kRefusing = uint64_t{1} << 62;

  const std::size_t mask_;
  const std::size_t slotBytes_;
  const std::unique_ptr<Slot[]> slots_;
  const std::unique_ptr<char[]> memory_;

  alignas(kCacheLine) std::atomic<uint64_t> written_{0};
  uint64_t takenSeen_ = 0;  // by the producer
  std::atomic<bool> abandoned_{false};

  alignas(kCacheLine) std::atomic<uint64_t> taken_{0};
  uint64_t writtenSeen_ = 0;  // by the consumer

  static_assert(
      decltype(written_)::is_always_lock_free && decltype(abandoned_)::is_always_lock_free,
      "on this target an atomic of 64 bits takes a lock, on which a real-time thread could wait");
};
