#pragma once

#include "tools/qvctl/QVSummaryFile.h"
#include "tools/qvctl/QVToolOutput.h"

#include <cstddef>
#include <cstdint>
#include <map>
#include <set>
#include <string>
#include <vector>

// qvctl summary plot: the numbers of a session over its messages, a picture for each key, or as
// JSON.
//
// The file is read twice, first for what a picture's edges are, then for what is in it: so memory
// grows with the number of keys and the size of the pictures. As JSON the numbers stand by their
// keys, which is not how the file has them: all of them are kept, in 16 bytes each.
//
// Threads: one. The output and the file outlive it. Failures: as QVSummaryFile; failed where there
// is no such number.
class QVSummaryPlot {
 public:
  // Of all of it: what is beside a picture, and a picture in which something is to be seen.
  static constexpr std::size_t kSmallestColumns = 23;
  static constexpr std::size_t kLargestColumns = 1000;
  static constexpr std::size_t kLargestRows = 200;
  // Different keys that are shown, those that come first: applications choose them, and each takes
  // memory for its picture.
  static constexpr std::size_t kMaximumKeys = 256;

  struct Options {
    std::vector<std::string> keys;  // patterns; empty: all
    std::size_t width = 0;          // of the whole, in columns; 0: the terminal's
    std::size_t height = 8;         // of each picture, in rows
    bool ascii = false;
  };

  QVSummaryPlot(QVToolOutput& output, const QVSummaryFile& file, const Options& options)
      : output_(output), file_(file), options_(options) {}

  void show();

 private:
  // What is known of a key's numbers before they are drawn.
  struct Range {
    int64_t count = 0;
    double lowest = 0;
    double highest = 0;
    double last = 0;
  };

  void findRanges();
  // Of a number that is not shown.
  void leaveOut(const std::string& key);
  void printPictures() const;
  void printPicture(const std::string& key, const Range& range,
                    const std::vector<std::string>& rows) const;
  void printJSON() const;

  QVToolOutput& output_;
  const QVSummaryFile& file_;
  const Options& options_;
  int64_t messages_ = 0;
  std::map<std::string, Range> ranges_;  // by key
  std::set<std::string> others_;         // the first of the keys that are not wanted, cut
  bool isCut_ = false;                   // there are more keys than are shown
};
