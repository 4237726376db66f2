#pragma once

#include <cstdint>

// The least that a service with an I/O thread and a work thread can do for a call: a byte comes in
// on one thread, is handed to the other, and the answer goes back the same way and out. The
// round trip through the service is measured against it in the same run.
class QVTwoThreadHop {
 public:
  // Serves one peer on a connected socket until it goes. Runs on the calling thread and one more.
  static void serve(int descriptor);
};
