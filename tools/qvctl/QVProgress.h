#pragma once

#include <chrono>
#include <string>

// How far a long operation is, in one line of standard error that is overwritten, and taken away
// before other text comes. Only where standard error is a terminal, and only of operations that
// take longer than a moment.
//
// Threads: one at a time.
class QVProgress {
 public:
  // What is going on: "reading events".
  explicit QVProgress(std::string text);
  ~QVProgress() { clear(); }
  QVProgress(const QVProgress&) = delete;
  QVProgress& operator=(const QVProgress&) = delete;

  // `part` of one whole.
  void show(double part);
  // Before other text comes to standard output: where that is a terminal, too, the line is taken
  // away.
  void makeRoom();
  void clear();

 private:
  using Clock = std::chrono::steady_clock;

  const std::string text_;
  const bool isTerminal_;
  const bool sharesTerminal_;
  Clock::time_point next_;
  bool isShown_ = false;
};
