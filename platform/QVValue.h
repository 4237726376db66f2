#pragma once

#include <concepts>
#include <cstdint>
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
// A string of 4 GiB or more is refused with std::length_error.
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
  static QVValue borrowing(std::string_view characters);

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

// A value is of little use without what it may hold; they need its definition in turn.
#include "platform/QVArray.h"
#include "platform/QVDictionary.h"
