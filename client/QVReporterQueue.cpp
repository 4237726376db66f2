#include "client/QVReporterQueue.h"

#include <algorithm>
#include <cstring>
#include <new>
#include <utility>

namespace {

// Bytes and records that steps of sessions may take beyond the bound: a thousand of them.
constexpr std::size_t kControlBytes = std::size_t{64} << 10;
constexpr std::size_t kControlRecords = 1'024;

// Bytes of memory that an empty buffer keeps.
constexpr std::size_t kKeptBufferBytes = std::size_t{256} << 10;

}  // namespace

struct QVReporterQueue::Header {
  std::size_t payloadBytes;
  QVReporterSessionState* session;
  uint32_t category;
  uint16_t type;
  QVReporterRecord::Kind kind;
};

std::size_t QVReporterQueue::recordBytes(std::size_t payloadBytes) {
  return sizeof(Header) + payloadBytes;
}

QVReporterQueue::QVReporterQueue(std::size_t maximumBytes, std::size_t maximumMessages)
    : maximumBytes_(maximumBytes), maximumMessages_(maximumMessages) {}

QVClientError::Code QVReporterQueue::push(const QVReporterRecord& record, bool& mustWake) {
  using Code = QVClientError::Code;
  mustWake = false;
  const std::size_t bytes = recordBytes(record.payload.size());
  const bool isMessage = record.kind == QVReporterRecord::Kind::message;
  if (isMessage && bytes > maximumBytes_) return Code::messageTooLarge;
  const std::size_t mostBytes = maximumBytes_ + (isMessage ? 0 : kControlBytes);
  const std::size_t mostRecords = maximumMessages_ + (isMessage ? 0 : kControlRecords);
  const Header header{record.payload.size(), record.session, record.category, record.type,
                      record.kind};

  QVMutexLock lock(mutex_);
  if (isClosed_) return Code::closed;
  if (record.kind != QVReporterRecord::Kind::destroy &&
      (queuedBytes() + bytes > mostBytes || queuedMessages() >= mostRecords)) {
    return Code::queueFull;
  }
  const std::size_t length = incoming_.size();
  try {
    if (incoming_.capacity() - length < bytes) {
      const std::size_t doubled = std::min(2 * incoming_.capacity(), maximumBytes_);
      incoming_.reserve(std::max(doubled, length + bytes));
    }
  } catch (const std::bad_alloc&) {
    return Code::outOfMemory;
  }
  incoming_.append(reinterpret_cast<const char*>(&header), sizeof header);
  incoming_.append(record.payload);
  bytes_.fetch_add(bytes, std::memory_order_relaxed);
  records_.fetch_add(1, std::memory_order_relaxed);
  ++accepted_;
  mustWake = std::exchange(isArmed_, false);
  return Code::none;
}

void QVReporterQueue::close() {
  QVMutexLock lock(mutex_);
  isClosed_ = true;
}

uint64_t QVReporterQueue::accepted() {
  QVMutexLock lock(mutex_);
  return accepted_;
}

bool QVReporterQueue::front(QVReporterRecord& record) {
  if (at_ == work_.size()) {
    work_.clear();
    at_ = 0;
    if (work_.capacity() > kKeptBufferBytes) std::string().swap(work_);
    QVMutexLock lock(mutex_);
    std::swap(work_, incoming_);
    if (work_.empty()) return false;
  }
  Header header;
  std::memcpy(&header, work_.data() + at_, sizeof header);
  record = {header.kind, header.type, header.category, header.session,
            std::string_view(work_).substr(at_ + sizeof header, header.payloadBytes)};
  return true;
}

std::span<char> QVReporterQueue::frontPayload() {
  Header header;
  std::memcpy(&header, work_.data() + at_, sizeof header);
  return {work_.data() + at_ + sizeof header, header.payloadBytes};
}

void QVReporterQueue::pop() {
  Header header;
  std::memcpy(&header, work_.data() + at_, sizeof header);
  const std::size_t bytes = recordBytes(header.payloadBytes);
  at_ += bytes;
  ++consumed_;
  bytes_.fetch_sub(bytes, std::memory_order_relaxed);
  records_.fetch_sub(1, std::memory_order_relaxed);
}

bool QVReporterQueue::armWakeUp() {
  if (at_ != work_.size()) return false;
  QVMutexLock lock(mutex_);
  isArmed_ = incoming_.empty();
  return isArmed_;
}
