#pragma once

#include "QVServices/Statistics/Service/QVReportingPayloadStore.h"
#include "platform/QVFunction.h"
#include "platform/QVValue.h"

#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <string_view>
#include <vector>

// One of a session's two arrays of recorded payloads: the aggregated one, whose entries have no
// name, or the nested one, whose entries are payloads under their message identifiers. Payloads lie
// in a store that both arrays share; an entry is its place there, and they are decoded while
// iterating.
//
// Threads: any. The array is its own recursive lock: every operation takes it, and a caller holds
// it (lock(), unlock()) over what must not be torn apart.
class QVReportingPayloadArray {
 public:
  using Position = QVReportingPayloadStore::Position;
  using Payload = QVReportingPayloadStore::Payload;
  // Receives entries in order: the identifier, empty for one that has no name, and the payload.
  // Both last for the call.
  using Visitor = QVFunction<void(std::string_view identifier, const Payload& payload)>;

  explicit QVReportingPayloadArray(std::shared_ptr<QVReportingPayloadStore> store)
      : store_(std::move(store)) {}

  void lock() { mutex_.lock(); }
  void unlock() { mutex_.unlock(); }

  // Appends a payload; answers where it lies, for an entry of the other array. Nothing, with
  // nothing appended, where the store is full.
  std::optional<Position> append(const QVDictionary& payload);
  // Appends the payload at `position` of the shared store under the identifier BASE_COUNT.
  void append(std::string_view identifierBase, uint32_t count, Position position);
  // Makes the payload the first entry, without a name, also where the store is full.
  void insertAtFront(const QVDictionary& payload);

  std::size_t size() const;
  bool empty() const { return size() == 0; }
  void forEach(Visitor visitor) const;

 private:
  // Kept apart from its base, of which there are few, the count makes an identifier of 8 bytes.
  struct Entry {
    Position position;
    uint32_t identifierBase;
    uint32_t count;  // from 1; 0: no identifier
  };

  // Chunks grow from the first size to the last: there may be many sessions that record little, and
  // large blocks go straight back to the system when a session stops.
  static constexpr std::size_t kFirstChunkEntries = 8;
  static constexpr std::size_t kLargestChunkEntries = 8192;

  void add(const Entry& entry);

  mutable std::recursive_mutex mutex_;
  const std::shared_ptr<QVReportingPayloadStore> store_;
  // Guarded by mutex_.
  std::vector<Entry> front_;                // inserted there, the latest last
  std::vector<std::vector<Entry>> chunks_;  // appended; never more than was reserved for each
  std::size_t size_ = 0;
};
