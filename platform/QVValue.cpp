#include "platform/QVValue.h"

#include <algorithm>
#include <atomic>
#include <cmath>
#include <cstring>
#include <limits>
#include <memory>
#include <new>
#include <stdexcept>
#include <utility>
#include <vector>

namespace {

using References = std::atomic<uint32_t>;

void retain(References& references) noexcept {
  references.fetch_add(1, std::memory_order_relaxed);
}

// Answers true for whoever lets go last and so has to free the memory.
bool letGo(References& references) noexcept {
  // A sole owner needs no atomic write: nobody else can be counting.
  return references.load(std::memory_order_acquire) == 1 ||
         references.fetch_sub(1, std::memory_order_acq_rel) == 1;
}

// A string of its own: the count lies right before the characters.
struct TextStorage {
  mutable References references{1};

  static const TextStorage* of(const char* characters) noexcept {
    return reinterpret_cast<const TextStorage*>(characters) - 1;
  }
  static const char* make(std::string_view text) {
    void* memory = ::operator new(sizeof(TextStorage) + text.size());
    auto* characters = reinterpret_cast<char*>(new (memory) TextStorage + 1);
    std::copy(text.begin(), text.end(), characters);
    return characters;
  }
};

// What a value keeps of a string's length.
uint32_t lengthOf(std::string_view text) {
  if (text.size() > UINT32_MAX) throw std::length_error("a string of 4 GiB or more");
  return static_cast<uint32_t>(text.size());
}

bool sameReal(double a, double b) noexcept {
  return a == b || (std::isnan(a) && std::isnan(b));
}

bool byKey(const QVDictionaryEntry& a, const QVDictionaryEntry& b) noexcept {
  return a.key < b.key;
}

// Sorts by key, keeps the last of equal keys, answers how many entries remain at the front.
std::size_t sortAndFold(std::span<QVDictionaryEntry> entries) {
  if (std::is_sorted(entries.begin(), entries.end(), byKey)) {
    // The usual case: senders in a hurry send sorted keys; only equal neighbours are left to fold.
  } else if (entries.size() <= 32) {
    for (auto entry = entries.begin() + 1; entry != entries.end(); ++entry) {
      std::rotate(std::upper_bound(entries.begin(), entry, *entry, byKey), entry, entry + 1);
    }
  } else {
    std::stable_sort(entries.begin(), entries.end(), byKey);
  }
  std::size_t kept = 0;
  for (std::size_t i = 0; i < entries.size(); ++i) {
    if (i + 1 < entries.size() && entries[i].key == entries[i + 1].key) continue;
    if (kept != i) entries[kept] = std::move(entries[i]);
    ++kept;
  }
  return kept;
}

}  // namespace

struct QVArrayStorage {
  mutable References references{1};
  uint32_t count;
  std::size_t bytes;  // with everything inside

  QVValue* items() const noexcept {
    return reinterpret_cast<QVValue*>(const_cast<QVArrayStorage*>(this) + 1);
  }
};

struct QVDictionaryStorage {
  mutable References references{1};
  uint32_t count;
  std::size_t bytes;  // with everything inside
  QVMemoryCharge* charge;

  QVDictionaryEntry* entries() const noexcept {
    return reinterpret_cast<QVDictionaryEntry*>(const_cast<QVDictionaryStorage*>(this) + 1);
  }
};

// Building and freeing the blocks of containers.
struct QVValueStorage {
  static std::size_t characters(const QVValue& value) noexcept {
    return value.isString() ? value.length_ : 0;
  }

  static std::size_t containerBytes(const QVValue& value) noexcept {
    if (!value.counted_) return 0;
    if (value.kind_ == QVValue::Kind::array) return value.bits_.array->bytes;
    if (value.kind_ == QVValue::Kind::dictionary) return value.bits_.dictionary->bytes;
    return 0;
  }

  // Makes `to` a copy of `from` that borrows its characters from `place`, which moves on.
  static void place(QVValue* to, const QVValue& from, char*& place) {
    if (!from.isString()) {
      new (to) QVValue(from);
      return;
    }
    if (from.length_ != 0) std::memcpy(place, from.bits_.characters, from.length_);
    new (to) QVValue(QVValue::borrowing({place, from.length_}));
    place += from.length_;
  }

  static const QVArrayStorage* makeArray(std::span<const QVValue> items) {
    std::size_t bytes = sizeof(QVArrayStorage) + items.size_bytes();
    std::size_t inner = 0;
    for (const QVValue& item : items) {
      bytes += characters(item);
      inner += containerBytes(item);
    }
    void* memory = ::operator new(bytes);
    auto* storage = new (memory)
        QVArrayStorage{.count = static_cast<uint32_t>(items.size()), .bytes = bytes + inner};
    auto* place = reinterpret_cast<char*>(storage->items() + items.size());
    for (std::size_t i = 0; i < items.size(); ++i) {
      QVValueStorage::place(storage->items() + i, items[i], place);
    }
    return storage;
  }

  static const QVDictionaryStorage* makeDictionary(std::span<const QVDictionaryEntry> entries,
                                                   QVMemoryCharge* charge) {
    std::size_t bytes = sizeof(QVDictionaryStorage) + entries.size_bytes();
    std::size_t inner = 0;
    for (const auto& entry : entries) {
      bytes += entry.key.size() + characters(entry.value);
      inner += containerBytes(entry.value);
    }
    void* memory = ::operator new(bytes);
    auto* storage = new (memory) QVDictionaryStorage{
        .count = static_cast<uint32_t>(entries.size()), .bytes = bytes + inner, .charge = charge};
    auto* place = reinterpret_cast<char*>(storage->entries() + entries.size());
    for (std::size_t i = 0; i < entries.size(); ++i) {
      QVDictionaryEntry* entry = storage->entries() + i;
      std::string_view key = entries[i].key;
      if (!key.empty()) std::memcpy(place, key.data(), key.size());
      new (&entry->key) std::string_view(place, key.size());
      place += key.size();
      QVValueStorage::place(&entry->value, entries[i].value, place);
    }
    if (charge != nullptr) charge->add(storage->bytes);
    return storage;
  }

  static void free(const QVArrayStorage* storage) noexcept {
    std::destroy_n(storage->items(), storage->count);
    ::operator delete(const_cast<QVArrayStorage*>(storage));
  }

  static void free(const QVDictionaryStorage* storage) noexcept {
    std::destroy_n(storage->entries(), storage->count);
    if (storage->charge != nullptr) storage->charge->remove(storage->bytes);
    ::operator delete(const_cast<QVDictionaryStorage*>(storage));
  }

  template <class Storage>
  static void releaseStorage(const Storage* storage) noexcept {
    if (storage != nullptr && letGo(storage->references)) free(storage);
  }
};

// ---- QVValue

QVValue::QVValue(std::string_view value)
    : length_(lengthOf(value)), kind_(Kind::string), counted_(true) {
  bits_.characters = TextStorage::make(value);
}

QVValue::QVValue(QVArray value) noexcept
    : bits_{.array = value.storage_}, kind_(Kind::array), counted_(value.storage_ != nullptr) {
  value.storage_ = nullptr;
}

QVValue::QVValue(QVDictionary value) noexcept
    : bits_{.dictionary = value.storage_},
      kind_(Kind::dictionary),
      counted_(value.storage_ != nullptr) {
  value.storage_ = nullptr;
}

QVValue QVValue::borrowing(std::string_view characters) {
  QVValue value;
  value.bits_.characters = characters.data();
  value.length_ = lengthOf(characters);
  value.kind_ = Kind::string;
  return value;
}

QVValue::QVValue(const QVValue& other) {
  retainOrCopy(other);
}

QVValue::QVValue(QVValue&& other) noexcept
    : bits_(other.bits_), length_(other.length_), kind_(other.kind_), counted_(other.counted_) {
  other.kind_ = Kind::absent;
  other.counted_ = false;
}

QVValue& QVValue::operator=(const QVValue& other) {
  if (this != &other) *this = QVValue(other);
  return *this;
}

QVValue& QVValue::operator=(QVValue&& other) noexcept {
  if (this == &other) return *this;
  if (counted_) release();
  bits_ = other.bits_;
  length_ = other.length_;
  kind_ = std::exchange(other.kind_, Kind::absent);
  counted_ = std::exchange(other.counted_, false);
  return *this;
}

void QVValue::retainOrCopy(const QVValue& other) {
  if (other.kind_ == Kind::string && !other.counted_) {
    bits_.characters = TextStorage::make(other.string());
    counted_ = true;
  } else {
    bits_ = other.bits_;
    counted_ = other.counted_;
    if (counted_) {
      switch (other.kind_) {
        case Kind::string:
          retain(TextStorage::of(bits_.characters)->references);
          break;
        case Kind::array:
          retain(bits_.array->references);
          break;
        case Kind::dictionary:
          retain(bits_.dictionary->references);
          break;
        default:
          break;
      }
    }
  }
  length_ = other.length_;
  kind_ = other.kind_;
}

void QVValue::release() noexcept {
  switch (kind_) {
    case Kind::string: {
      const TextStorage* storage = TextStorage::of(bits_.characters);
      if (letGo(storage->references)) ::operator delete(const_cast<TextStorage*>(storage));
      break;
    }
    case Kind::array:
      QVValueStorage::releaseStorage(bits_.array);
      break;
    case Kind::dictionary:
      QVValueStorage::releaseStorage(bits_.dictionary);
      break;
    default:
      break;
  }
}

QVArray QVValue::array() const noexcept {
  if (bits_.array != nullptr) retain(bits_.array->references);
  return QVArray(bits_.array);
}

QVDictionary QVValue::dictionary() const noexcept {
  if (bits_.dictionary != nullptr) retain(bits_.dictionary->references);
  return QVDictionary(bits_.dictionary);
}

int64_t QVValue::integerValue() const noexcept {
  switch (kind_) {
    case Kind::boolean:
      return bits_.boolean ? 1 : 0;
    case Kind::integer:
      return bits_.integer;
    case Kind::unsignedInteger:
      return INT64_MAX;
    case Kind::real:
      if (std::isnan(bits_.real)) return 0;
      // 2^63 is the first double above the range; the range's lower end is a double itself.
      if (bits_.real >= 0x1p63) return INT64_MAX;
      if (bits_.real < -0x1p63) return INT64_MIN;
      return static_cast<int64_t>(bits_.real);
    default:
      return 0;
  }
}

double QVValue::doubleValue() const noexcept {
  switch (kind_) {
    case Kind::boolean:
      return bits_.boolean ? 1.0 : 0.0;
    case Kind::integer:
      return static_cast<double>(bits_.integer);
    case Kind::unsignedInteger:
      return static_cast<double>(bits_.natural);
    case Kind::real:
      return bits_.real;
    default:
      return 0.0;
  }
}

bool QVValue::operator==(const QVValue& other) const noexcept {
  if (kind_ != other.kind_) return false;
  switch (kind_) {
    case Kind::absent:
      return true;
    case Kind::boolean:
      return bits_.boolean == other.bits_.boolean;
    case Kind::integer:
      return bits_.integer == other.bits_.integer;
    case Kind::unsignedInteger:
      return bits_.natural == other.bits_.natural;
    case Kind::real:
      return sameReal(bits_.real, other.bits_.real);
    case Kind::string:
      return string() == other.string();
    case Kind::array:
      return array() == other.array();
    case Kind::dictionary:
      return dictionary() == other.dictionary();
  }
  return false;
}

// ---- QVDictionary

QVDictionary::QVDictionary(std::initializer_list<QVDictionaryEntry> entries) {
  std::vector<QVDictionaryEntry> copies(entries);
  *this = assemble(copies);
}

QVDictionary QVDictionary::assemble(std::span<QVDictionaryEntry> entries, QVMemoryCharge* charge) {
  return QVDictionary(QVValueStorage::makeDictionary(entries.first(sortAndFold(entries)), charge));
}

QVDictionary::QVDictionary(const QVDictionary& other) noexcept : storage_(other.storage_) {
  if (storage_ != nullptr) retain(storage_->references);
}

QVDictionary::~QVDictionary() {
  QVValueStorage::releaseStorage(storage_);
}

std::size_t QVDictionary::size() const noexcept {
  return storage_ == nullptr ? 0 : storage_->count;
}

const QVDictionaryEntry* QVDictionary::begin() const noexcept {
  return storage_ == nullptr ? nullptr : storage_->entries();
}

const QVDictionaryEntry* QVDictionary::end() const noexcept {
  return begin() + size();
}

const QVValue* QVDictionary::find(std::string_view key) const noexcept {
  const auto* entry =
      std::lower_bound(begin(), end(), key,
                       [](const QVDictionaryEntry& e, std::string_view k) { return e.key < k; });
  return entry != end() && entry->key == key ? &entry->value : nullptr;
}

QVDictionary QVDictionary::merging(std::span<const QVDictionaryEntry> other,
                                   QVMemoryCharge* charge) const {
  std::vector<QVDictionaryEntry> entries;
  entries.reserve(size() + other.size());
  const auto borrow = [&entries](const QVDictionaryEntry& entry) {
    entries.push_back({entry.key, entry.value.isString() ? QVValue::borrowing(entry.value.string())
                                                         : entry.value});
  };
  std::for_each(begin(), end(), borrow);
  std::for_each(other.begin(), other.end(), borrow);
  return assemble(entries, charge);
}

QVMemoryCharge* QVDictionary::charge() const noexcept {
  return storage_ == nullptr ? nullptr : storage_->charge;
}

std::size_t QVDictionary::footprint() const noexcept {
  return storage_ == nullptr ? 0 : storage_->bytes;
}

bool QVDictionary::operator==(const QVDictionary& other) const noexcept {
  return storage_ == other.storage_ ||
         std::equal(begin(), end(), other.begin(), other.end(),
                    [](const QVDictionaryEntry& a, const QVDictionaryEntry& b) {
                      return a.key == b.key && a.value == b.value;
                    });
}

// ---- QVArray

QVArray::QVArray(std::initializer_list<QVValue> items)
    : QVArray(QVValueStorage::makeArray({items.begin(), items.size()})) {}

QVArray QVArray::assemble(std::span<const QVValue> items) {
  return QVArray(QVValueStorage::makeArray(items));
}

QVArray::QVArray(const QVArray& other) noexcept : storage_(other.storage_) {
  if (storage_ != nullptr) retain(storage_->references);
}

QVArray::~QVArray() {
  QVValueStorage::releaseStorage(storage_);
}

std::size_t QVArray::size() const noexcept {
  return storage_ == nullptr ? 0 : storage_->count;
}

const QVValue* QVArray::begin() const noexcept {
  return storage_ == nullptr ? nullptr : storage_->items();
}

const QVValue* QVArray::end() const noexcept {
  return begin() + size();
}

bool QVArray::operator==(const QVArray& other) const noexcept {
  return storage_ == other.storage_ || std::equal(begin(), end(), other.begin(), other.end());
}
