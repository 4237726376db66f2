#pragma once

#include "client/QVClientError.h"
#include "client/QVClientExport.h"

#include <array>
#include <concepts>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <string_view>
#include <utility>

// A message's or configuration's dictionary, put together entry by entry in the form in which it
// goes over the wire:
//
//   payload.set("frames", 480).set("route", "speaker");
//   payload.beginDictionary("device").set("name", "pcm0").endDictionary();
//   payload.beginArray("levels").add(-3.5).add(-6.0).endArray();
//
// Keep one and clear() it between messages: once it has held the largest of them, nothing is
// allocated any more. One that is given its memory never allocates: all of its members but error()
// may then be called where nothing may wait. Of entries with the same key the last one counts.
//
// Errors stick: after the first one nothing more is taken in until clear(), and calls that are
// given the payload answer error(). So a whole payload is written without looking.
//
// Threads: one at a time. A call copies the payload; it may be changed as soon as the call returns.
// Limits: 8 MiB, or the memory given, up to 21 bytes of which an entry may ask for and not use; 20
// dictionaries or 30 arrays within each other.
class QV_CLIENT_API QVClientPayload {
 public:
  QVClientPayload() = default;
  // Written into memory that outlives it; what does not fit there is messageTooLarge.
  explicit QVClientPayload(std::span<char> memory) noexcept { use(memory); }
  QVClientPayload(QVClientPayload&& other) noexcept;
  QVClientPayload& operator=(QVClientPayload&& other) noexcept;

  // Sets an entry of the innermost dictionary.
  template <class Value>
  QVClientPayload& set(std::string_view key, Value&& value) {
    return put(&key, std::forward<Value>(value));
  }
  // Adds an item to the innermost array.
  template <class Value>
  QVClientPayload& add(Value&& value) {
    return put(nullptr, std::forward<Value>(value));
  }

  // A dictionary or an array within: with a key in a dictionary, without one in an array.
  QVClientPayload& beginDictionary(std::string_view key) { return begin(&key, false); }
  QVClientPayload& beginDictionary() { return begin(nullptr, false); }
  QVClientPayload& endDictionary() { return end(false); }
  QVClientPayload& beginArray(std::string_view key) { return begin(&key, true); }
  QVClientPayload& beginArray() { return begin(nullptr, true); }
  QVClientPayload& endArray() { return end(true); }

  // Empty again and without error; keeps its memory.
  void clear() noexcept;

  // The first thing that went wrong, or that something is still open; no error where it can be
  // sent.
  QVClientError error() const;
  QVClientError::Code errorCode() const noexcept;
  // The first thing that went wrong so far, whatever is open.
  QVClientError::Code failureCode() const noexcept {
    return failure_ != nullptr ? failureCode_ : QVClientError::Code::none;
  }
  bool ok() const noexcept { return failure_ == nullptr && depth_ == 0; }

  // The entries as they go over the wire, alignment counted from the first byte. For the client.
  std::string_view entries() const noexcept { return {bytes_, size_}; }
  // From now on in that memory, whose first `filled` bytes are entries already. For the client.
  void use(std::span<char> memory, std::size_t filled = 0) noexcept;

 private:
  using Key = const std::string_view*;  // null in an array

  struct Container {
    std::size_t lengthAt = 0;
    std::size_t begin = 0;
    unsigned wireDepth = 0;
    bool isArray = false;
  };
  static constexpr std::size_t kMaximumOpenContainers = 32;

  template <std::same_as<bool> Boolean>
  QVClientPayload& put(Key key, Boolean value) {
    return putBoolean(key, value);
  }
  template <std::signed_integral Integer>
  QVClientPayload& put(Key key, Integer value) {
    return putInteger(key, value);
  }
  template <std::unsigned_integral Integer>
  requires(!std::same_as<Integer, bool>) QVClientPayload& put(Key key, Integer value) {
    return putUnsigned(key, value);
  }
  template <std::floating_point Real>
  QVClientPayload& put(Key key, Real value) {
    return putReal(key, static_cast<double>(value));
  }
  QVClientPayload& put(Key key, std::string_view value);
  QVClientPayload& put(Key key, std::span<const int64_t> values);
  QVClientPayload& put(Key key, std::span<const double> values);
  QVClientPayload& putBoolean(Key key, bool value);
  QVClientPayload& putInteger(Key key, int64_t value);
  QVClientPayload& putUnsigned(Key key, uint64_t value);
  QVClientPayload& putReal(Key key, double value);
  QVClientPayload& putNumbers(Key key, std::string_view signature, const void* numbers,
                              std::size_t count);
  QVClientPayload& begin(Key key, bool isArray);
  QVClientPayload& end(bool isArray);

  char* beginValue(Key key, std::string_view signature, std::size_t alignment,
                   std::size_t valueBytes);
  bool makeRoom(std::size_t bytes);
  void fail(QVClientError::Code code, const char* text) noexcept;

  std::unique_ptr<char[]> own_;  // null where it was given its memory
  char* bytes_ = nullptr;
  std::size_t size_ = 0;
  std::size_t capacity_ = 0;
  bool mayGrow_ = true;
  std::array<Container, kMaximumOpenContainers> open_;  // the first depth_ are in use
  std::size_t depth_ = 0;
  const char* failure_ = nullptr;
  QVClientError::Code failureCode_ = QVClientError::Code::none;
};
