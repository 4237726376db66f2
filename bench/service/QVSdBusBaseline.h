#pragma once

#include <chrono>
#include <cstdint>
#include <string>

// The platform's own bus library on both ends of a message, to measure the service's wire against
// in the same run.
class QVSdBusBaseline {
 public:
  // Serves one peer on a connected socket until it goes: checks and reads every entry of
  // SendMessage, answers it, does nothing else. Runs on the calling thread.
  static void serve(int descriptor);

  // Sends `count` SendMessage calls with a ten-entry message to a listening socket, `window` of
  // them unanswered at a time, and waits for the last answer. Throws on failure.
  static void send(const std::string& socketPath, int64_t count, int64_t window);
  // The same over a connected socket.
  static void send(int descriptor, int64_t count, int64_t window);
};
