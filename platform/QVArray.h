#pragma once

#include "platform/QVValue.h"

#include <cstddef>
#include <initializer_list>
#include <span>
#include <utility>

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
