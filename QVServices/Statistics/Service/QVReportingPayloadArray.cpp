#include "QVServices/Statistics/Service/QVReportingPayloadArray.h"

#include "platform/QVText.h"

#include <string>
#include <vector>

std::deque<QVReportingPayloadArray::Entry>& QVReportingPayloadArray::entries() {
  return entries_ ? *entries_ : entries_.emplace();
}

QVReportingPayloadArray::Position QVReportingPayloadArray::append(const QVDictionary& payload) {
  const std::lock_guard lock(mutex_);
  const Position position = store_->append(payload);
  entries().push_back({position, 0, 0});
  return position;
}

void QVReportingPayloadArray::append(std::string_view identifierBase, uint32_t count,
                                     Position position) {
  const std::lock_guard lock(mutex_);
  entries().push_back({position, store_->intern(identifierBase), count});
}

void QVReportingPayloadArray::insertAtFront(const QVDictionary& payload) {
  const std::lock_guard lock(mutex_);
  entries().push_front({store_->append(payload), 0, 0});
}

std::size_t QVReportingPayloadArray::size() const {
  const std::lock_guard lock(mutex_);
  return entries_ ? entries_->size() : 0;
}

void QVReportingPayloadArray::forEach(Visitor visitor) const {
  const std::lock_guard lock(mutex_);
  // By index, and up to what is there now: a visitor holds the lock too and may append.
  const std::size_t count = size();
  std::string identifier;
  std::vector<QVDictionaryEntry> room;
  for (std::size_t i = 0; i < count; ++i) {
    const Entry entry = (*entries_)[i];
    identifier.clear();
    if (entry.count != 0) {
      identifier += store_->interned(entry.identifierBase);
      identifier += '_';
      QVAppendText(identifier, entry.count);
    }
    visitor(identifier, store_->read(entry.position, room));
  }
}
