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

QVReportingPayloadStore::Position QVReportingPayloadStore::positionInLatestChunk(
    std::size_t offset) const {
  return (Position{chunks_.size() - 1} << kOffsetBits) | offset;
}

QVReportingPayloadStore::Position QVReportingPayloadStore::place(std::string_view encoded) {
  if (chunks_.empty() || chunks_.back().capacity() - chunks_.back().size() < encoded.size()) {
    const std::size_t next = chunks_.empty()
                                 ? kFirstChunkBytes
                                 : std::min(chunks_.back().capacity() * 2, kLargestChunkBytes);
    // A chunk without its memory would keep what it gets within itself, and move with the vector.
    std::string chunk;
    chunk.reserve(std::max(next, encoded.size()));
    chunks_.push_back(std::move(chunk));
    chunkBytes_ += chunks_.back().capacity();
  }
  const Position position = positionInLatestChunk(chunks_.back().size());
  chunks_.back() += encoded;
  ++payloads_;
  return position;
}

QVReportingPayloadStore::Position QVReportingPayloadStore::placeInItsOwnChunk(std::string encoded) {
  // What is large for its structure, not for its texts, is far smaller encoded.
  if (encoded.capacity() - encoded.size() > encoded.size() / 8) encoded.shrink_to_fit();
  chunks_.push_back(std::move(encoded));
  chunkBytes_ += chunks_.back().capacity();
  ++payloads_;
  return positionInLatestChunk(0);
}

std::optional<QVReportingPayloadStore::Position> QVReportingPayloadStore::appendIfNotFull(
    const QVDictionary& payload) {
  {
    const std::lock_guard lock(mutex_);
    if (chunkBytes_ + knownTexts_.writtenOut() + payloads_ * kEntryBytes < maximumBytes_) {
      return add(payload);
    }
    if (std::exchange(hasRefused_, true)) return std::nullopt;
  }
  if (whenFull_) whenFull_();
  return std::nullopt;
}

QVReportingPayloadStore::Position QVReportingPayloadStore::append(const QVDictionary& payload) {
  const std::lock_guard lock(mutex_);
  return add(payload);
}

QVReportingPayloadStore::Position QVReportingPayloadStore::add(const QVDictionary& payload) {
  // A summary is as long as all that was sent before it: it is written once, to where it stays. The
  // decoded size is at least the encoded one.
  if (payload.footprint() > kLargestChunkBytes) {
    std::string encoded;
    encoded.reserve(payload.footprint());
    encode(payload, encoded);
    return encoded.size() < kLargestChunkBytes ? place(encoded)
                                               : placeInItsOwnChunk(std::move(encoded));
  }
  scratch_.clear();
  encode(payload, scratch_);
  return place(scratch_);
}

void QVReportingPayloadStore::encode(const QVDictionary& payload, std::string& out) {
  const uint64_t keySet = keySetOf(payload);
  QVReportingEncodeNumber(out, keySet);
  if (keySet == 0) QVReportingEncodeNumber(out, payload.size());
  for (const auto& entry : payload) {
    if (keySet == 0) QVReportingEncodeText(out, entry.key);
    QVReportingEncodeValue(out, entry.value, knownTexts_);
  }
}

QVReportingPayloadStore::Payload QVReportingPayloadStore::read(
    Position position, std::vector<QVDictionaryEntry>& room) const {
  const uint8_t* bytes = nullptr;
  uint64_t keySet = 0;
  const std::string* keys = nullptr;
  {
    const std::lock_guard lock(mutex_);
    QVReportingPayloadDecoder decoder(
        reinterpret_cast<const uint8_t*>(chunks_[position >> kOffsetBits].data()) +
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
  // Room first: a text that was given a number must have its place, too.
  if (texts_.size() == texts_.capacity()) texts_.reserve(2 * texts_.size() + 8);
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
