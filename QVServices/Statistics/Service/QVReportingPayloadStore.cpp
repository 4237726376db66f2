#include "QVServices/Statistics/Service/QVReportingPayloadStore.h"

#include "QVServices/Statistics/Service/QVReportingPayloadCoding.h"

#include <algorithm>
#include <functional>
#include <utility>

namespace {

// A position is a chunk's index and an offset within the chunk.
constexpr unsigned kOffsetBits = 32;

// Bytes of a payload's entries in the two arrays that share the store.
constexpr std::size_t kEntryBytes = 32;

std::size_t hashOfKeys(const QVDictionary& payload) {
  std::size_t hash = payload.size();
  for (const auto& entry : payload) {
    hash = hash * 31 + std::hash<std::string_view>{}(entry.key);
  }
  return hash;
}

}  // namespace

QVReportingPayloadStore::QVReportingPayloadStore(std::size_t maximumBytes,
                                                 QVFunction<void()> whenFull)
    : maximumBytes_(maximumBytes), whenFull_(std::move(whenFull)) {}

bool QVReportingPayloadStore::hasKeys(const QVDictionary& payload, const Keys& keys) {
  return std::equal(
      payload.begin(), payload.end(), keys.begin(), keys.end(),
      [](const QVDictionaryEntry& entry, const std::string& key) { return entry.key == key; });
}

uint64_t QVReportingPayloadStore::keySetOf(const QVDictionary& payload) {
  if (latestKeySet_ < keySets_.size() && hasKeys(payload, keySets_[latestKeySet_])) {
    return latestKeySet_ + 1;
  }
  const std::size_t hash = hashOfKeys(payload);
  const auto [first, last] = keySetsByHash_.equal_range(hash);
  const auto known = std::find_if(first, last, [this, &payload](const auto& candidate) {
    return hasKeys(payload, keySets_[candidate.second]);
  });
  if (known != last) {
    latestKeySet_ = known->second;
    return latestKeySet_ + 1;
  }
  std::size_t bytes = payload.size() * sizeof(std::string);
  for (const auto& entry : payload) bytes += entry.key.size();
  if (keySets_.size() == kMaximumKeySets || keySetBytes_ + bytes > kMaximumKeySetBytes) return 0;
  keySetBytes_ += bytes;
  Keys keys;
  keys.reserve(payload.size());
  for (const auto& entry : payload) keys.emplace_back(entry.key);
  latestKeySet_ = keySets_.size();
  keySets_.push_back(std::move(keys));
  keySetsByHash_.emplace(hash, latestKeySet_);
  return latestKeySet_ + 1;
}

QVReportingPayloadStore::Position QVReportingPayloadStore::place(std::string_view encoded) {
  if (chunks_.empty() || chunks_.back().capacity - chunks_.back().used < encoded.size()) {
    const std::size_t next = chunks_.empty()
                                 ? kFirstChunkBytes
                                 : std::min(chunks_.back().capacity * 2, kLargestChunkBytes);
    const std::size_t capacity = std::max(next, encoded.size());
    chunks_.push_back({std::make_unique_for_overwrite<uint8_t[]>(capacity), 0, capacity});
    chunkBytes_ += capacity;
  }
  Chunk& chunk = chunks_.back();
  std::copy(encoded.begin(), encoded.end(), chunk.bytes.get() + chunk.used);
  const Position position = (Position{chunks_.size() - 1} << kOffsetBits) | chunk.used;
  chunk.used += encoded.size();
  return position;
}

std::optional<QVReportingPayloadStore::Position> QVReportingPayloadStore::appendIfNotFull(
    const QVDictionary& payload) {
  {
    const std::lock_guard lock(mutex_);
    if (chunkBytes_ + knownTexts_.footprint() + payloads_ * kEntryBytes < maximumBytes_)
      return encode(payload);
    if (std::exchange(hasRefused_, true)) return std::nullopt;
  }
  if (whenFull_) whenFull_();
  return std::nullopt;
}

QVReportingPayloadStore::Position QVReportingPayloadStore::append(const QVDictionary& payload) {
  const std::lock_guard lock(mutex_);
  return encode(payload);
}

QVReportingPayloadStore::Position QVReportingPayloadStore::encode(const QVDictionary& payload) {
  scratch_.clear();
  const uint64_t keySet = keySetOf(payload);
  QVReportingEncodeNumber(scratch_, keySet);
  if (keySet == 0) QVReportingEncodeNumber(scratch_, payload.size());
  for (const auto& entry : payload) {
    if (keySet == 0) QVReportingEncodeText(scratch_, entry.key);
    QVReportingEncodeValue(scratch_, entry.value, knownTexts_);
  }
  const Position position = place(scratch_);
  ++payloads_;
  // A summary is as long as all that was sent before it.
  if (scratch_.capacity() > kLargestChunkBytes) std::string().swap(scratch_);
  return position;
}

QVReportingPayloadStore::Payload QVReportingPayloadStore::read(
    Position position, std::vector<QVDictionaryEntry>& room) const {
  const uint8_t* bytes = nullptr;
  uint64_t keySet = 0;
  const std::string* keys = nullptr;
  {
    const std::lock_guard lock(mutex_);
    QVReportingPayloadDecoder decoder(chunks_[position >> kOffsetBits].bytes.get() +
                                      (position & ((Position{1} << kOffsetBits) - 1)));
    keySet = decoder.number();
    if (keySet != 0) {
      const Keys& set = keySets_[keySet - 1];
      keys = set.data();
      room.resize(set.size());
    } else {
      room.resize(decoder.number());
    }
    bytes = decoder.position();
  }
  // What has been appended stays as it is and where it is, so nobody need wait for the decoding.
  QVReportingPayloadDecoder decoder(bytes);
  for (std::size_t i = 0; i < room.size(); ++i) {
    room[i].key = keys == nullptr ? decoder.text() : std::string_view(keys[i]);
    room[i].value = decoder.value();
  }
  return {.entries = room, .keySet = keySet};
}

uint32_t QVReportingPayloadStore::intern(std::string_view text) {
  const std::lock_guard lock(mutex_);
  if (const auto known = textNumbers_.find(text); known != textNumbers_.end()) {
    return known->second;
  }
  const auto number = static_cast<uint32_t>(texts_.size());
  texts_.push_back(&textNumbers_.emplace(text, number).first->first);
  return number;
}

std::string_view QVReportingPayloadStore::interned(uint32_t number) const {
  const std::lock_guard lock(mutex_);
  return *texts_[number];
}

std::size_t QVReportingPayloadStore::footprint() const {
  const std::lock_guard lock(mutex_);
  return scratch_.capacity() + chunkBytes_ + knownTexts_.footprint();
}
