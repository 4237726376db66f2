#pragma once

#include "platform/QVWorkQueue.h"

#include <algorithm>
#include <cstddef>
#include <utility>
#include <vector>

// Work items in the order in which they came, in chunks that grow: one item takes little, many are
// never moved again. Empty, it has no memory.
//
// Used by QVAsioSerialQueue. Threads: one at a time.
// Failures: add() throws std::bad_alloc and leaves the item with the caller's argument.
class QVWorkItems {
 public:
  bool isEmpty() const noexcept { return chunks_.empty(); }

  void add(QVWorkItem&& item) {
    if (chunks_.empty() || chunks_.back().size() == chunks_.back().capacity()) {
      std::vector<QVWorkItem> chunk;
      chunk.reserve(chunks_.empty() ? 1 : std::min(2 * chunks_.back().capacity(), kLargestChunk));
      chunks_.push_back(std::move(chunk));
    }
    chunks_.back().push_back(std::move(item));
  }

  // Calls `visit` with each item. A chunk's memory goes as soon as all of its items have had their
  // turn.
  template <class Visitor>
  void consume(Visitor visit) {
    for (std::vector<QVWorkItem>& chunk : std::exchange(chunks_, {})) {
      for (QVWorkItem& item : chunk) visit(item);
      std::vector<QVWorkItem>().swap(chunk);
    }
  }

 private:
  static constexpr std::size_t kLargestChunk = 64;

  std::vector<std::vector<QVWorkItem>> chunks_;  // none of them empty
};
