#pragma once

#include <cstddef>
#include <string>
#include <string_view>

// Cuts a stream of bytes into whole messages. Bytes in, messages out; no I/O, and no look at what
// a message says but for its length:
//
//     |order|type|flags|version|body length|serial|field length| fields ... |pad to 8| body ... |
//     0     1    2     3       4           8      12           16
//
// The stream may be cut anywhere. What is whole in the bytes fed is handed out where it lies; only
// the beginning of a message that is not whole yet is copied and kept. One per connection; an idle
// one holds no memory.
//
// Threads: one at a time.
// Limits: a message of more than 8 MiB is refused as soon as its length is known. Memory grows with
// what has come in, not with what is announced.
class QVBusFrameDecoder {
 public:
  enum class Result { message, needsMore, malformed };

  // Takes bytes in. They must stay where they are until next() no longer answers a message; only
  // then may more be fed.
  void feed(std::string_view bytes) noexcept { input_ = bytes; }

  // The next whole message, valid until the next call. Once malformed, it stays so.
  [[nodiscard]] Result next(std::string_view& message);

  // Why the stream is malformed.
  const char* failure() const noexcept { return failure_; }

  // Memory held for a message that is not whole yet.
  std::size_t bytesHeld() const noexcept { return kept_.empty() ? 0 : kept_.capacity(); }

 private:
  std::size_t messageLength(const char* header) noexcept;
  bool keepUpTo(std::size_t length);

  std::string_view input_;      // fed, not yet handed out or kept
  std::string kept_;            // the beginning of the next message
  bool handedOutKept_ = false;  // kept_ is the message that next() answered last
  const char* failure_ = nullptr;
};
