#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

// The server's side of the exchange of lines before the first message: mechanism EXTERNAL, by which
// a peer claims the user ID that the kernel has already told us. No I/O.
//
//   start --NUL--> waitingForAuth --AUTH EXTERNAL--> waitingForData --DATA--> waitingForBegin
//                    |      ^ '------AUTH EXTERNAL hex-------------------------^   |
//                    |      '---CANCEL, ERROR, wrong identity------------------'   |
//                    '--> failed <-- (from every state)          done <--BEGIN-----'
//
// A peer may send everything at once, its first messages included.
//
// Threads: one at a time. One per connection, dropped when done.
// Limits: lines of 4 KiB, 16 refusals; a peer that goes beyond has failed.
class QVBusAuthServer {
 public:
  enum class State { start, waitingForAuth, waitingForData, waitingForBegin, done, failed };

  // `userID` is the peer's as the kernel knows it; `serverID` 32 hexadecimal digits.
  QVBusAuthServer(uint32_t userID, std::string_view serverID);

  // Takes bytes in and appends answers to `out`. Answers how many bytes were taken: all, or, when
  // done, those up to the end of BEGIN; what follows belongs to the first message.
  [[nodiscard]] std::size_t feed(std::string_view bytes, std::string& out);

  State state() const noexcept { return state_; }
  // Why it failed.
  const char* failure() const noexcept { return failure_; }

 private:
  void takeLine(std::string_view line, std::string& out);
  void takeAuth(std::string_view arguments, std::string& out);
  void takeIdentity(std::string_view hexadecimal, std::string& out);
  void reject(std::string& out);
  void refuse(std::string_view answer, std::string& out);
  void fail(const char* reason);

  const std::string userIDText_;
  const std::string serverID_;
  std::string line_;  // the beginning of a line that is not whole yet
  State state_ = State::start;
  unsigned refusals_ = 0;
  const char* failure_ = nullptr;
};
