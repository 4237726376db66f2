#pragma once

#include <cstddef>
#include <string_view>

// The fuzz targets of the readers of files that others wrote. Each takes a file's bytes, and aborts
// where the reader breaks a promise.
//
// Threads: one.

// How far an input got: what a seed must reach to be worth its place.
struct QVFuzzFileProgress {
  std::size_t accepted = 0;  // files in order, lines that count
  std::size_t items = 0;     // channels, values

  bool operator==(const QVFuzzFileProgress&) const = default;
};

// A driver's file. Whatever is answered points into the bytes, and the same bytes answer the same.
QVFuzzFileProgress QVFuzzMMV(std::string_view input);
// A text of the kernel. What a line counts is read again from its plainest form.
QVFuzzFileProgress QVFuzzKernelText(std::string_view input);
// A configuration. What is read and written again is read as the same value.
QVFuzzFileProgress QVFuzzJSONFile(std::string_view input);
// An array that is scanned. What the reader of configurations takes in is taken in, too.
QVFuzzFileProgress QVFuzzJSONScan(std::string_view input);
