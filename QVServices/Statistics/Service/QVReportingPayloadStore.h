#pragma once

#include "QVServices/Statistics/Service/QVReportingKnownTexts.h"
#include "platform/QVFunction.h"
#include "platform/QVValue.h"

#include <cstddef>
#include <cstdint>
#include <map>
#include <mutex>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

// Keeps the payloads of one running session encoded in a fraction of their decoded size: the keys
// of a payload are kept once per set of keys, texts that come again and again once, other values in
// as few bytes as they need. Shared by the session's two payload arrays, so that a payload is kept
// once for both.
//
// Append-only; everything goes with the last owner.
// Threads: any; locked inside, calls out without the lock.
class QVReportingPayloadStore {
 public:
  // Names one payload within its store.
  using Position = uint64_t;

  // A payload while it is looked at: the entries of its dictionary, in ascending order of the keys.
  // Characters are borrowed from the store, the entries from whoever asked.
  struct Payload {
    std::span<const QVDictionaryEntry> entries;
    // Of one store's payloads, those of the same number other than 0 have the same keys.
    uint64_t keySet;
  };

  // Bytes that one session's payloads may take, with their entries in the two arrays, and with each
  // text as often as it comes, as the summary spells it out: some six million ordinary messages. A
  // client that never stops its session must not take all memory, nor must its summary.
  static constexpr std::size_t kMaximumBytes = std::size_t{1} << 30;

  // Calls `whenFull`, where there is one, when a payload is refused for the first time, on the
  // thread that brings it.
  explicit QVReportingPayloadStore(std::size_t maximumBytes = kMaximumBytes,
                                   QVFunction<void()> whenFull = {});

  // Keeps the payload in any case.
  Position append(const QVDictionary& payload);
  // Nothing, and the payload is not kept, once the maximum has been reached. The one that reaches
  // it is kept whole.
  std::optional<Position> appendIfNotFull(const QVDictionary& payload);
  // Decodes the payload into `room`, which is used again and again for one payload after the other.
  Payload read(Position position, std::vector<QVDictionaryEntry>& room) const;

  // A short number for a text that many entries share.
  uint32_t intern(std::string_view text);
  // Valid as long as the store.
  std::string_view interned(uint32_t number) const;

  // Bytes of memory that the encoded payloads, and their encoding, take.
  std::size_t footprint() const;

 private:
  using Keys = std::vector<std::string>;

  // Sets of keys beyond these are written out with each payload: a client that never sends the
  // same keys twice must not make the table larger than what it describes.
  static constexpr std::size_t kMaximumKeySets = 4096;
  // Bytes of all sets' keys, for clients whose sets are wide.
  static constexpr std::size_t kMaximumKeySetBytes = std::size_t{1} << 20;
  // Chunks grow from the first size to the last, so that a session with one message stays small.
  static constexpr std::size_t kFirstChunkBytes = 512;
  static constexpr std::size_t kLargestChunkBytes = 65536;

  // What follows: with the lock held.
  Position add(const QVDictionary& payload);
  void encode(const QVDictionary& payload, std::string& out);
  static bool hasKeys(const QVDictionary& payload, const Keys& keys);
  // The number of the payload's set of keys, from 1; 0 where it has to be written out.
  uint64_t keySetOf(const QVDictionary& payload);
  Position place(std::string_view encoded);
  Position placeInItsOwnChunk(std::string encoded);
  Position positionInLatestChunk(std::size_t offset) const;

  // Constant after creation.
  const std::size_t maximumBytes_;
  QVFunction<void()> whenFull_;  // called once

  mutable std::mutex mutex_;
  // All guarded by mutex_.
  std::size_t chunkBytes_ = 0;
  std::size_t payloads_ = 0;
  bool hasRefused_ = false;
  std::vector<Keys> keySets_;
  std::size_t keySetBytes_ = 0;
  std::multimap<std::size_t, std::size_t> keySetsByHash_;
  std::size_t latestKeySet_ = 0;  // index into keySets_; messages come in runs of one kind
  QVReportingKnownTexts knownTexts_;
  // None grows beyond its first capacity, which is on the heap, so bytes never move.
  std::vector<std::string> chunks_;
  std::map<std::string, uint32_t, std::less<>> textNumbers_;
  std::vector<const std::string*> texts_;  // by number: the keys of textNumbers_
  std::string scratch_;                    // the payload being encoded, kept for its capacity
};
