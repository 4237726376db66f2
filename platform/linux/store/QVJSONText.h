#pragma once

#include "platform/QVValue.h"

#include <memory>
#include <string_view>

// Writes values as JSON text, one line without blanks, from the value straight into one buffer that
// is used again for the next text. Used by the event store for its payloads.
//
// Doubles are the shortest text that reads back equal and keep their kind (12.0, 1e+300); NaN and
// the infinities, which JSON has no word for, are the strings "nan", "inf" and "-inf"; bytes that
// are no UTF-8 become U+FFFD; keys come in ascending byte order, as dictionaries iterate.
//
// Threads: one at a time. A text is valid until the next one is written.
class QVJSONText {
 public:
  QVJSONText();
  ~QVJSONText();
  QVJSONText(const QVJSONText&) = delete;
  QVJSONText& operator=(const QVJSONText&) = delete;

  // The value's text. An absent value is null, an absent dictionary an empty one.
  [[nodiscard]] std::string_view write(const QVValue& value);
  [[nodiscard]] std::string_view write(const QVDictionary& value);

  // Drops the last text; the memory of a large one is freed.
  void clear();

 private:
  struct State;
  const std::unique_ptr<State> state_;
};
