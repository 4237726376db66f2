#pragma once

#include "platform/QVError.h"
#include "platform/QVFunction.h"
#include "platform/QVValue.h"

#include <memory>
#include <optional>
#include <span>
#include <string_view>

// One JSON array that is written element by element, pretty-printed: two blanks of indentation, one
// member a line, keys in ascending order. Text goes to the sink in pieces as it comes to be, so an
// array of any length takes constant memory.
//
// Doubles are the shortest text that reads back equal and keep their kind (12.0); bytes that are no
// UTF-8 become U+FFFD; NaN and the infinities cannot be written.
//
// Threads: one at a time; the sink is called on the caller's.
class QVJSONArrayStream {
 public:
  virtual ~QVJSONArrayStream() = default;
  // Appends an object of these members, which are those of a dictionary: in ascending order of the
  // keys, each once. Answers why it cannot be written; after that nothing more reaches the sink,
  // and the array is no valid text.
  [[nodiscard]] virtual std::optional<QVError> append(
      std::span<const QVDictionaryEntry> members) = 0;
  // Appends an object whose one member is such an object.
  [[nodiscard]] virtual std::optional<QVError> append(
      std::string_view name, std::span<const QVDictionaryEntry> members) = 0;
  // Ends the array. Not after a failure.
  virtual void end() = 0;
};

// Writes JSON text. Threads: any, at once.
class QVJSONOutput {
 public:
  using Sink = QVFunction<void(std::string_view text)>;

  virtual ~QVJSONOutput() = default;
  virtual std::unique_ptr<QVJSONArrayStream> makeArrayStream(Sink sink) = 0;
};
