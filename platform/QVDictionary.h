#pragma once

#include "platform/QVMemoryCharge.h"
#include "platform/QVValue.h"

#include <cstddef>
#include <initializer_list>
#include <span>
#include <string_view>
#include <utility>

// One entry of a QVDictionary.
struct QVDictionaryEntry {
  std::string_view key;
  QVValue value;
};

// An immutable dictionary with string keys, iterated in ascending byte order of the key. A handle
// of one pointer; copies share the contents. A handle without contents is an absent dictionary and
// reads as an empty one.
class QVDictionary {
 public:
  QVDictionary() noexcept = default;
  QVDictionary(std::initializer_list<QVDictionaryEntry> entries);

  // Copies keys, values and characters out of `entries` into one block. `entries` is sorted in
  // place; of equal keys the later one wins. The block's bytes are charged to `charge` (may be
  // null) until the last handle goes.
  static QVDictionary assemble(std::span<QVDictionaryEntry> entries,
                               QVMemoryCharge* charge = nullptr);

  QVDictionary(const QVDictionary& other) noexcept;
  QVDictionary(QVDictionary&& other) noexcept : storage_(other.storage_) {
    other.storage_ = nullptr;
  }
  QVDictionary& operator=(QVDictionary other) noexcept {
    std::swap(storage_, other.storage_);
    return *this;
  }
  ~QVDictionary();

  bool isAbsent() const noexcept { return storage_ == nullptr; }
  std::size_t size() const noexcept;
  bool empty() const noexcept { return size() == 0; }
  const QVDictionaryEntry* begin() const noexcept;
  const QVDictionaryEntry* end() const noexcept;

  // Null where there is no such key. Valid as long as a handle to this dictionary exists.
  const QVValue* find(std::string_view key) const noexcept;
  bool contains(std::string_view key) const noexcept { return find(key) != nullptr; }

  // A dictionary with these entries and, over them, those of `other`, charged as assemble() says
  // and not as either of the two is.
  QVDictionary merging(const QVDictionary& other, QVMemoryCharge* charge = nullptr) const {
    return merging(std::span(other.begin(), other.size()), charge);
  }
  QVDictionary merging(std::initializer_list<QVDictionaryEntry> other,
                       QVMemoryCharge* charge = nullptr) const {
    return merging(std::span(other), charge);
  }

  // What the memory of this dictionary is charged to; null where to nothing.
  QVMemoryCharge* charge() const noexcept;
  // Bytes of memory that the contents take, nested arrays and dictionaries included.
  std::size_t footprint() const noexcept;

  bool sharesContentsWith(const QVDictionary& other) const noexcept {
    return storage_ == other.storage_;
  }
  // Equal contents; an absent dictionary equals an empty one.
  bool operator==(const QVDictionary& other) const noexcept;

 private:
  friend class QVValue;
  explicit QVDictionary(const QVDictionaryStorage* storage) noexcept : storage_(storage) {}
  QVDictionary merging(std::span<const QVDictionaryEntry> other, QVMemoryCharge* charge) const;
  const QVDictionaryStorage* storage_ = nullptr;
};
