#include "QVServices/Statistics/Service/QVReportingPayloadArray.h"

#include "platform/QVText.h"

#include <algorithm>
#include <string>
#include <vector>

void QVReportingPayloadArray::add(const Entry& entry) {
  if (chunks_.empty() || chunks_.back().size() == chunks_.back().capacity()) {
    const std::size_t wanted = chunks_.empty() ? kFirstChunkEntries : 2 * chunks_.back().capacity();
    chunks_.emplace_back().reserve(std::min(wanted, kLargestChunkEntries));
  }
  chunks_.back().push_back(entry);
  ++size_;
}

std::optional<QVReportingPayloadArray::Position> QVReportingPayloadArray::append(
    const QVDictionary& payload) {
  const std::lock_guard lock(mutex_);
  const std::optional<Position> position = store_->appendIfNotFull(payload);
  if (position) add({*position, 0, 0});
  return position;
}

void QVReportingPayloadArray::append(std::string_view identifierBase, uint32_t count,
                                     Position position) {
  const std::lock_guard lock(mutex_);
  add({position, store_->intern(identifierBase), count});
}

void QVReportingPayloadArray::insertAtFront(const QVDictionary& payload) {
  const std::lock_guard lock(mutex_);
  front_.push_back({store_->append(payload), 0, 0});
  ++size_;
}

std::size_t QVReportingPayloadArray::size() const {
  const std::lock_guard lock(mutex_);
  return size_;
}

void QVReportingPayloadArray::forEach(Visitor visitor) const {
  const std::lock_guard lock(mutex_);
  std::string identifier;
  std::vector<QVDictionaryEntry> room;
  const auto visit = [&](const Entry entry) {
    identifier.clear();
    if (entry.count != 0) {
      identifier += store_->interned(entry.identifierBase);
      identifier += '_';
      QVAppendText(identifier, entry.count);
    }
    visitor(identifier, store_->read(entry.position, room));
  };
  // By index, and up to what is there now: a visitor holds the lock too and may append.
  std::size_t left = size_ - front_.size();
  for (std::size_t i = front_.size(); i > 0; --i) visit(front_[i - 1]);
  for (std::size_t chunk = 0; left > 0; ++chunk) {
    const std::size_t count = std::min(left, chunks_[chunk].size());
    for (std::size_t i = 0; i < count; ++i) visit(chunks_[chunk][i]);
    left -= count;
  }
}
