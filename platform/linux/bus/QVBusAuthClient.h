#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

// The client's side of authentication, for the client library: sends everything at once, so that
// the first calls follow without a round trip, then reads the server's one answer. No I/O.
//
// Threads: one at a time.
// Limits: an answer of 256 bytes; a server that says more has failed.
class QVBusAuthClient {
 public:
  enum class State { waitingForAnswer, done, failed };

  // What to send first; messages may follow at once.
  static std::string opening(uint32_t userID);

  // Takes bytes in. Answers how many were taken: all, or, when done, those up to the end of the
  // answer; what follows belongs to the first message.
  [[nodiscard]] std::size_t feed(std::string_view bytes);

  State state() const noexcept { return state_; }

 private:
  std::string line_;
  State state_ = State::waitingForAnswer;
};
