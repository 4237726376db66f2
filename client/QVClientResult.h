#pragma once

#include "client/QVClientError.h"

#include <utility>

// What an operation answers: its value, or the error that came instead.
//
// `if (result)` is true where there is a value. Threads: as any value.
template <class Value>
class QVClientResult {
 public:
  QVClientResult() = default;
  QVClientResult(Value value) : value_(std::move(value)) {}
  QVClientResult(QVClientError error) : error_(std::move(error)) {}

  explicit operator bool() const noexcept { return !error_; }
  const QVClientError& error() const noexcept { return error_; }
  // A default-made value where there is an error.
  Value& value() noexcept { return value_; }
  const Value& value() const noexcept { return value_; }

 private:
  Value value_{};
  QVClientError error_;
};
