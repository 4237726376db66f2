#pragma once

#include "client/QVClientError.h"
#include "client/QVClientVocabulary.h"
#include "platform/linux/QVThreadAnnotations.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>

struct QVReporterSessionState;

// What a program asked its reporter for: a message, or a step in a session's life.
struct QVReporterRecord {
  enum class Kind : uint8_t {
    open,
    setServiceType,
    setConfiguration,
    start,
    message,
    stop,
    destroy
  };

  Kind kind = Kind::message;
  uint16_t type = 0;  // the message's, or the service type
  uint32_t category = 0;
  QVReporterSessionState* session = nullptr;  // none: every session
  std::string_view payload{};
};

// The way from a program's threads to the reporter's: records in the order in which they came, in
// one buffer that is swapped out when the one before is worked off.
//
// The bound holds for what is in both. Beyond it, messages are refused; steps of sessions have room
// of their own, so that a flood of messages keeps no session from stopping; the destruction of a
// session is always taken, since there is one for each.
//
// Threads: as marked. Failures: without memory the record is refused.
class QVReporterQueue {
 public:
  QVReporterQueue(std::size_t maximumBytes, std::size_t maximumMessages);

  // Any thread. Copies the payload. `mustWake` says whether the reporter's thread waits for it.
  QVClientError::Code push(const QVReporterRecord& record, bool& mustWake);
  // Nothing more is taken.
  void close();
  // How many records were ever taken.
  uint64_t accepted();
  std::size_t queuedBytes() const { return bytes_.load(std::memory_order_relaxed); }
  std::size_t queuedMessages() const { return records_.load(std::memory_order_relaxed); }

  // The reporter's thread. The oldest record, valid until pop(); false where there is none.
  bool front(QVReporterRecord& record);
  // The payload of front(), to be read through a QVClientPayload.
  std::span<char> frontPayload();
  void pop();
  // How many records were popped.
  uint64_t consumed() const { return consumed_; }
  // The next push says that it must wake; false where there is something already.
  bool armWakeUp();

 private:
  struct Header;
  static std::size_t recordBytes(std::size_t payloadBytes);

  const std::size_t maximumBytes_;
  const std::size_t maximumMessages_;
  std::atomic<std::size_t> bytes_{0};
  std::atomic<std::size_t> records_{0};

  std::string work_;  // the reporter's thread's, as are the next two
  std::size_t at_ = 0;
  uint64_t consumed_ = 0;

  QVMutex mutex_;
  std::string incoming_ QV_GUARDED_BY(mutex_);
  uint64_t accepted_ QV_GUARDED_BY(mutex_) = 0;
  bool isArmed_ QV_GUARDED_BY(mutex_) = false;
  bool isClosed_ QV_GUARDED_BY(mutex_) = false;
};
