#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

// How far an input got: what a seed must reach to be worth its place.
struct QVFuzzBusProgress {
  std::size_t messages = 0;      // whole, with a header in order
  std::size_t bodies = 0;        // in order, too
  std::size_t dictionaries = 0;  // taken in and written again
  std::size_t calls = 0;         // that reached the exported object

  bool operator==(const QVFuzzBusProgress&) const = default;
};

// Takes bytes as a peer's stream, from authentication on: the first byte says how the stream is
// cut. Aborts where two ways to read the same bytes disagree.
//
// Threads: one.
QVFuzzBusProgress QVFuzzBusFrames(std::string_view input);
