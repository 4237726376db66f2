#pragma once

#include "platform/QVFunction.h"
#include "platform/linux/QVThreadAnnotations.h"
#include "platform/linux/bus/QVBusWriter.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

// What is on its way to one peer: any thread puts messages in, marshalled at once; the connection's
// thread takes all of them out and writes them in one go. Closed with its connection; from then on
// it takes nothing.
//
// Owned by the connection and by the replies that are still out, which so outlive it harmlessly.
//
// Threads: any.
class QVBusOutbox : public std::enable_shared_from_this<QVBusOutbox> {
 public:
  // Bytes. Calls that were taken in before their peer stopped reading may still be answered at
  // length; a peer for which more than this waits is given up.
  static constexpr std::size_t kMostBytes = std::size_t{16} << 20;

  // `wake` is called when there is something to take, once until it has been taken; under the lock
  // and on any thread, so it only posts. Within a QVWakeUpBatch it is called at the batch's end.
  explicit QVBusOutbox(QVFunction<void()> wake) : wake_(std::move(wake)) {}

  // Puts in one message with that header (its serial is given here), its body written by
  // `body(QVBusWriter&)`.
  template <class Body>
  void put(QVBusHeader header, Body&& body) QV_EXCLUDES(mutex_) {
    const QVMutexLock lock(mutex_);
    if (closed_ || overflowed_) return;
    header.serial = nextSerial();
    const std::size_t before = bytes_.size();
    try {
      QVBusWriter writer(bytes_);
      writer.beginMessage(header);
      body(writer);
      writer.endMessage();
    } catch (...) {
      bytes_.resize(before);  // half a message would spoil all that follow
      throw;
    }
    if (bytes_.size() > kMostBytes) overflowed_ = true;
    wakeOnce();
  }
  // Bytes as they are: the lines of authentication.
  void putBytes(std::string_view bytes) QV_EXCLUDES(mutex_);

  // The rest is for the connection's thread.
  //
  // It is about to put things in and will take them out itself: no wake until then.
  void hold() QV_EXCLUDES(mutex_);
  // Hands out all bytes, in exchange for an empty buffer.
  void take(std::string& empty) QV_EXCLUDES(mutex_);
  std::size_t size() QV_EXCLUDES(mutex_);
  // More came than may wait; what came after it is not here.
  bool hasOverflowed() QV_EXCLUDES(mutex_);
  void close() QV_EXCLUDES(mutex_);

 private:
  uint32_t nextSerial() QV_REQUIRES(mutex_) {
    if (++serial_ == 0) serial_ = 1;
    return serial_;
  }
  void wakeOnce() QV_REQUIRES(mutex_);
  void wake() QV_EXCLUDES(mutex_);

  QVMutex mutex_;
  std::string bytes_ QV_GUARDED_BY(mutex_);
  QVFunction<void()> wake_ QV_GUARDED_BY(mutex_);
  uint32_t serial_ QV_GUARDED_BY(mutex_) = 0;
  bool woken_ QV_GUARDED_BY(mutex_) = false;
  bool closed_ QV_GUARDED_BY(mutex_) = false;
  bool overflowed_ QV_GUARDED_BY(mutex_) = false;
};
