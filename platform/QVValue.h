#pragma once

#include <compare>
#include <concepts>
#include <cstdint>
#include <initializer_list>
#include <span>
#include <string>
#include <string_view>
#include <type_traits>
#include <utility>

class QVArray;
class QVDictionary;

// One value of a message, a configuration or a preference: absent, boolean, signed 64-bit,
// unsigned 64-bit (only above the signed range: smaller ones are signed), double, string (UTF-8
// bytes), array or dictionary.
//
// Immutable but for assignment, 16 bytes, cheap to copy. A value that lies inside an array or a
// dictionary may borrow its characters from the container's memory; a copy of it is always
// self-contained, a reference to it is valid as long as its container.
//
// Threads: distinct QVValue objects may share contents across threads; one object may not be
// assigned while another thread uses it.
class QVValue {
 public:
  enum class Kind : uint8_t {
    absent,
    boolean,
    integer,
    unsignedInteger,
    real,
    string,
    array,
    dictionary
  };

  QVValue() noexcept = default;
  template <std::same_as<bool> Boolean>
  QVValue(Boolean value) noexcept : bits_{.boolean = value}, kind_(Kind::boolean) {}
  template <std::signed_integral Integer>
  QVValue(Integer value) noexcept : bits_{.integer = value}, kind_(Kind::integer) {}
  template <std::unsigned_integral Integer>
  requires(!std::same_as<Integer, bool>) QVValue(Integer value)
  noexcept
      : bits_{.natural = value},
        kind_(static_cast<uint64_t>(value) > uint64_t{INT64_MAX} ? Kind::unsignedInteger
                                                                 : Kind::integer) {}
  QVValue(double value) noexcept : bits_{.real = value}, kind_(Kind::real) {}
  QVValue(std::string_view value);
  QVValue(const std::string& value) : QVValue(std::string_view(value)) {}
  QVValue(const char* value) : QVValue(std::string_view(value)) {}
  QVValue(QVArray value) noexcept;
  QVValue(QVDictionary value) noexcept;

  // A string whose characters stay where they are and must outlive the value; copies own theirs.
  static QVValue borrowing(std::string_view characters) noexcept;

  QVValue(const QVValue& other);
  QVValue(QVValue&& other) noexcept;
  QVValue& operator=(const QVValue& other);
  QVValue& operator=(QVValue&& other) noexcept;
  ~QVValue() {
    if (counted_) release();
  }

  Kind kind() const noexcept { return kind_; }
  bool isAbsent() const noexcept { return kind_ == Kind::absent; }
  bool isString() const noexcept { return kind_ == Kind::string; }
  // Boolean, integer, unsigned integer or real.
  bool isNumber() const noexcept { return kind_ >= Kind::boolean && kind_ <= Kind::real; }

  // The contents; the kind must be the one named.
  bool boolean() const noexcept { return bits_.boolean; }
  int64_t integer() const noexcept { return bits_.integer; }
  uint64_t unsignedInteger() const noexcept { return bits_.natural; }
  double real() const noexcept { return bits_.real; }
  std::string_view string() const noexcept { return {bits_.characters, length_}; }
  QVArray array() const noexcept;
  QVDictionary dictionary() const noexcept;

  // Readings of any kind. Numbers out of range saturate, NaN is 0, everything else that is no
  // number is 0.
  int64_t integerValue() const noexcept;
  double doubleValue() const noexcept;

  // Same kind and same contents (NaN equals NaN, so that a value equals its copy).
  bool operator==(const QVValue& other) const noexcept;

 private:
  friend class QVArray;
  friend class QVDictionary;
  friend struct QVValueStorage;

  void retainOrCopy(const QVValue& other);
  void release() noexcept;

  union Bits {
    bool boolean;
    int64_t integer;
    uint64_t natural;
    double real;
    const char* characters;
    const struct QVArrayStorage* array;
    const struct QVDictionaryStorage* dictionary;
  } bits_{.integer = 0};
  uint32_t length_ = 0;  // of a string, in bytes
  Kind kind_ = Kind::absent;
  bool counted_ = false;  // holds a reference to counted memory
};

// Is told of memory that messages of one origin occupy. Any thread. Whoever makes one keeps it
// alive until everything that was added has been removed.
class QVMemoryCharge {
 public:
  virtual void add(std::size_t bytes) noexcept = 0;
  virtual void remove(std::size_t bytes) noexcept = 0;

 protected:
  ~QVMemoryCharge() = default;
};

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

  // A dictionary with these entries and, over them, those of `other`, charged as this one is.
  QVDictionary merging(const QVDictionary& other) const;

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
  const QVDictionaryStorage* storage_ = nullptr;
};

// An immutable array of values; as a handle like QVDictionary.
class QVArray {
 public:
  QVArray() noexcept = default;
  QVArray(std::initializer_list<QVValue> items);
  static QVArray assemble(std::span<const QVValue> items);

  QVArray(const QVArray& other) noexcept;
  QVArray(QVArray&& other) noexcept : storage_(other.storage_) { other.storage_ = nullptr; }
  QVArray& operator=(QVArray other) noexcept {
    std::swap(storage_, other.storage_);
    return *this;
  }
  ~QVArray();

  std::size_t size() const noexcept;
  bool empty() const noexcept { return size() == 0; }
  const QVValue* begin() const noexcept;
  const QVValue* end() const noexcept;
  const QVValue& operator[](std::size_t index) const noexcept { return begin()[index]; }

  bool operator==(const QVArray& other) const noexcept;

 private:
  friend class QVValue;
  explicit QVArray(const QVArrayStorage* storage) noexcept : storage_(storage) {}
  const QVArrayStorage* storage_ = nullptr;
};
