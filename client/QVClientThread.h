#pragma once

#include "client/QVClientError.h"

#include <functional>

#include <pthread.h>

// A thread of the library's, as a guest in a program: all signals are blocked, since the program's
// handlers run on the program's threads; it runs with ordinary scheduling, whatever the thread that
// made it had; its stack is small, since programs that lock their memory pay for all of it. Its
// name is "quietvox".
//
// Used by QVClientConnection and QVReporter. Threads: one at a time. Ownership: joined or detached
// before it goes, where it was started.
class QVClientThread {
 public:
  QVClientThread() = default;
  QVClientThread(const QVClientThread&) = delete;
  QVClientThread& operator=(const QVClientThread&) = delete;

  // Once. `body` must not throw. Answers cannotConnect where the system has no thread, outOfMemory.
  QVClientError start(std::function<void()> body);
  bool joinable() const noexcept { return isJoinable_; }
  void join();
  void detach();

 private:
  pthread_t thread_{};
  bool isJoinable_ = false;
};
