#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>

// Lines of the kernel's text files, "key: value" or "key value", whose value begins with a decimal
// integer that ends there or at a blank: "12 frames" counts, "1.5", "0x10" and "12kB" do not.
// Blanks are spaces and tabs; those around key and value do not count.
//
// A line is read in up to three ways, and the first whose value is such an integer holds: divided
// at the first ":" that a blank or the line's end follows ("hw_ptr      : 4096"), at the first
// blank
// ("pgfault 12"), at the first ":" ("frames:12").
//
// Threads: any; plain functions.
struct QVKernelText {
  // Bytes of a file; the longest of the kernel's own that count anything have a tenth of it.
  static constexpr std::size_t kMaximumBytes = std::size_t{256} * 1024;
  // Bytes of a key. A line with a longer one does not count.
  static constexpr std::size_t kMaximumKeyBytes = 255;

  struct Counter {
    std::string_view key;  // into the line
    int64_t value = 0;     // saturated
  };

  // What the line counts, if anything.
  static std::optional<Counter> parseLine(std::string_view line);

  // Takes the next line off the text, without its end; nothing where there is none left.
  static std::optional<std::string_view> takeLine(std::string_view& text);
};
