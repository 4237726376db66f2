#include "client/QVClientPayload.h"

#include "platform/linux/bus/QVBusBytes.h"
#include "platform/linux/bus/QVBusProtocol.h"
#include "platform/linux/bus/QVBusText.h"

#include <algorithm>
#include <bit>
#include <cstring>
#include <new>

namespace {

// Bytes; holds a usual message, so that most payloads allocate once in their lives.
constexpr std::size_t kFirstCapacity = 512;

// What an entry takes beside its key and its value: padding, the key's length and end, the
// signature's, padding again.
constexpr std::size_t kEntryOverhead = 7 + 4 + 1 + 2 + 7;

// Containers around an entry of the outermost dictionary: the dictionary's array.
constexpr unsigned kOutermostDepth = 1;
// What lies between a dictionary and a value in it, at most: entry and variant, or in an array
// variant and array of numbers.
constexpr unsigned kDepthOfValue = 2;

template <class Number>
void storeNumber(char* at, Number number) noexcept {
  if constexpr (std::endian::native == std::endian::big) number = QVBusSwap(number);
  std::memcpy(at, &number, sizeof number);
}

}  // namespace

QVClientPayload::QVClientPayload(QVClientPayload&& other) noexcept {
  *this = std::move(other);
}

QVClientPayload& QVClientPayload::operator=(QVClientPayload&& other) noexcept {
  if (this == &other) return *this;
  own_ = std::move(other.own_);
  bytes_ = std::exchange(other.bytes_, nullptr);
  size_ = std::exchange(other.size_, 0);
  capacity_ = std::exchange(other.capacity_, 0);
  mayGrow_ = std::exchange(other.mayGrow_, true);
  depth_ = std::exchange(other.depth_, 0);
  std::copy_n(other.open_.begin(), depth_, open_.begin());
  failure_ = std::exchange(other.failure_, nullptr);
  failureCode_ = other.failureCode_;
  return *this;
}

void QVClientPayload::clear() noexcept {
  size_ = 0;
  depth_ = 0;
  failure_ = nullptr;
}

void QVClientPayload::use(std::span<char> memory, std::size_t filled) noexcept {
  own_.reset();
  bytes_ = memory.data();
  capacity_ = memory.size();
  mayGrow_ = false;
  clear();
  size_ = filled;
}

QVClientError::Code QVClientPayload::errorCode() const noexcept {
  if (failure_ != nullptr) return failureCode_;
  return depth_ != 0 ? QVClientError::Code::invalidPayload : QVClientError::Code::none;
}

QVClientError QVClientPayload::error() const {
  if (failure_ != nullptr) return {failureCode_, failure_};
  if (depth_ != 0) {
    return {QVClientError::Code::invalidPayload,
            "a dictionary or an array of the payload is not closed"};
  }
  return {};
}

void QVClientPayload::fail(QVClientError::Code code, const char* text) noexcept {
  if (failure_ != nullptr) return;
  failure_ = text;
  failureCode_ = code;
}

bool QVClientPayload::makeRoom(std::size_t bytes) {
  if (bytes <= capacity_ - size_) return true;
  if (!mayGrow_) {
    fail(QVClientError::Code::messageTooLarge, "the payload is larger than the memory given");
    return false;
  }
  if (bytes > kBusMaximumMessageBytes - size_) {
    fail(QVClientError::Code::messageTooLarge, "the payload is larger than 8 MiB");
    return false;
  }
  const std::size_t capacity =
      std::min(std::max({kFirstCapacity, 2 * capacity_, size_ + bytes}), kBusMaximumMessageBytes);
  std::unique_ptr<char[]> larger(new (std::nothrow) char[capacity]);
  if (larger == nullptr) {
    fail(QVClientError::Code::outOfMemory, "no memory for the payload");
    return false;
  }
  if (size_ != 0) std::memcpy(larger.get(), bytes_, size_);
  own_ = std::move(larger);
  bytes_ = own_.get();
  capacity_ = capacity;
  return true;
}

// Writes the key, where there is one, and the variant's signature, and takes `valueBytes` behind
// the padding that `alignment` asks for. Answers where the value goes; null after an error.
char* QVClientPayload::beginValue(Key key, std::string_view signature, std::size_t alignment,
                                  std::size_t valueBytes) {
  if (failure_ != nullptr) return nullptr;
  const bool inArray = depth_ != 0 && open_[depth_ - 1].isArray;
  if (inArray != (key == nullptr)) {
    fail(QVClientError::Code::invalidPayload,
         inArray ? "an item of an array has no key" : "an entry of a dictionary needs a key");
    return nullptr;
  }
  const std::size_t keyBytes = key != nullptr ? key->size() : 0;
  // A wild length must not wrap around in the sum.
  const std::size_t largest = std::max(keyBytes, valueBytes);
  const std::size_t bytes = largest > kBusMaximumMessageBytes
                                ? largest
                                : kEntryOverhead + keyBytes + signature.size() + valueBytes;
  if (!makeRoom(bytes)) return nullptr;

  char* const buffer = bytes_;
  std::size_t at = size_;
  const auto padTo = [buffer, &at](std::size_t multiple) {
    for (const std::size_t aligned = QVBusAlign(at, multiple); at != aligned; ++at) buffer[at] = 0;
  };
  if (key != nullptr) {
    if (!QVBusIsValidText(*key)) {
      fail(QVClientError::Code::invalidPayload, "a key of the payload is no UTF-8 text");
      return nullptr;
    }
    padTo(8);
    storeNumber(buffer + at, static_cast<uint32_t>(keyBytes));
    at += sizeof(uint32_t);
    if (keyBytes != 0) std::memcpy(buffer + at, key->data(), keyBytes);
    at += keyBytes;
    buffer[at++] = 0;
  }
  buffer[at++] = static_cast<char>(signature.size());
  std::memcpy(buffer + at, signature.data(), signature.size());
  at += signature.size();
  buffer[at++] = 0;
  padTo(alignment);
  size_ = at + valueBytes;
  return buffer + at;
}

QVClientPayload& QVClientPayload::putBoolean(Key key, bool value) {
  if (char* at = beginValue(key, "b", 4, 4)) storeNumber(at, value ? 1U : 0U);
  return *this;
}

QVClientPayload& QVClientPayload::putInteger(Key key, int64_t value) {
  if (char* at = beginValue(key, "x", 8, 8)) storeNumber(at, static_cast<uint64_t>(value));
  return *this;
}

QVClientPayload& QVClientPayload::putUnsigned(Key key, uint64_t value) {
  if (value <= uint64_t{INT64_MAX}) return putInteger(key, static_cast<int64_t>(value));
  if (char* at = beginValue(key, "t", 8, 8)) storeNumber(at, value);
  return *this;
}

QVClientPayload& QVClientPayload::putReal(Key key, double value) {
  if (char* at = beginValue(key, "d", 8, 8)) storeNumber(at, std::bit_cast<uint64_t>(value));
  return *this;
}

QVClientPayload& QVClientPayload::put(Key key, std::string_view value) {
  // A wild length must not wrap around in the sum.
  const std::size_t bytes = std::min(value.size(), kBusMaximumMessageBytes);
  char* at = beginValue(key, "s", 4, sizeof(uint32_t) + bytes + 1);
  if (at == nullptr) return *this;
  // Only now, so that it never reads more than there is room for.
  if (!QVBusIsValidText(value)) {
    fail(QVClientError::Code::invalidPayload, "a text of the payload is no UTF-8");
    return *this;
  }
  storeNumber(at, static_cast<uint32_t>(value.size()));
  at += sizeof(uint32_t);
  if (!value.empty()) std::memcpy(at, value.data(), value.size());
  at[value.size()] = 0;
  return *this;
}

QVClientPayload& QVClientPayload::put(Key key, std::span<const int64_t> values) {
  return putNumbers(key, "ax", values.data(), values.size());
}

QVClientPayload& QVClientPayload::put(Key key, std::span<const double> values) {
  return putNumbers(key, "ad", values.data(), values.size());
}

QVClientPayload& QVClientPayload::putNumbers(Key key, std::string_view signature,
                                             const void* numbers, std::size_t count) {
  // A wild count must not wrap around either.
  const std::size_t bytes = std::min(count, kBusMaximumMessageBytes) * sizeof(uint64_t);
  char* at = beginValue(key, signature, 4, sizeof(uint32_t) + 4 + bytes);
  if (at == nullptr) return *this;
  storeNumber(at, static_cast<uint32_t>(bytes));
  at += sizeof(uint32_t);
  // The numbers begin at a multiple of 8, which is here or 4 bytes further.
  if (static_cast<std::size_t>(at - bytes_) % 8 != 0) {
    storeNumber(at, uint32_t{0});
    at += 4;
  } else {
    size_ -= 4;
  }
  for (std::size_t i = 0; i < count; ++i) {
    uint64_t number = 0;
    std::memcpy(&number, static_cast<const char*>(numbers) + i * sizeof number, sizeof number);
    storeNumber(at + i * sizeof number, number);
  }
  return *this;
}

QVClientPayload& QVClientPayload::begin(Key key, bool isArray) {
  const bool inArray = depth_ != 0 && open_[depth_ - 1].isArray;
  const unsigned around = depth_ != 0 ? open_[depth_ - 1].wireDepth : kOutermostDepth;
  const unsigned wireDepth = around + (inArray ? 2 : 3);
  if (wireDepth + kDepthOfValue > kBusMaximumDepth) {
    fail(QVClientError::Code::invalidPayload, "the payload is nested too deeply");
    return *this;
  }
  char* at = beginValue(key, isArray ? "av" : "a{sv}", 4, sizeof(uint32_t));
  if (at == nullptr) return *this;
  const std::size_t lengthAt = static_cast<std::size_t>(at - bytes_);
  if (!isArray && size_ % 8 != 0) {
    if (!makeRoom(4)) return *this;
    storeNumber(bytes_ + size_, uint32_t{0});
    size_ += 4;
  }
  open_[depth_++] = {lengthAt, size_, wireDepth, isArray};
  return *this;
}

QVClientPayload& QVClientPayload::end(bool isArray) {
  if (failure_ != nullptr) return *this;
  if (depth_ == 0 || open_[depth_ - 1].isArray != isArray) {
    fail(QVClientError::Code::invalidPayload,
         isArray ? "no array is open to be closed" : "no dictionary is open to be closed");
    return *this;
  }
  const Container& container = open_[--depth_];
  storeNumber(bytes_ + container.lengthAt, static_cast<uint32_t>(size_ - container.begin));
  return *this;
}
