#pragma once

#include "platform/QVValue.h"
#include "platform/linux/store/QVJSONText.h"

#include <cstddef>
#include <exception>
#include <string>
#include <string_view>

// Thrown where the reader of standard output has gone away: the command ends, quietly.
struct QVReaderGone : std::exception {};

// qvctl's standard output: lines for people or, with --json, JSON text, one value a line. Colours
// only on a terminal, and not where the environment variable NO_COLOR says so or TERM is "dumb".
//
// Text for people that comes from elsewhere has to go through QVDisplayText first; JSON is made
// safe here.
//
// Threads: one at a time. Ownership: the descriptors stay the process's.
class QVToolOutput {
 public:
  enum class Style { plain, title, dim, good, bad };

  explicit QVToolOutput(bool json, int descriptor = 1);
  ~QVToolOutput();
  QVToolOutput(const QVToolOutput&) = delete;
  QVToolOutput& operator=(const QVToolOutput&) = delete;

  bool isJSON() const { return isJSON_; }
  int descriptor() const { return descriptor_; }
  // Of the terminal; 0 where there is none, and a line may be as long as it is.
  std::size_t columns() const;

  // The text as it is to look here: with colour or without.
  std::string painted(Style style, std::string_view text) const;

  // One line; the text has no line end. Lines are collected until flush(), or until there are many.
  void line(std::string_view text);
  // One value as a line of JSON.
  void json(const QVValue& value);
  // Bytes as they are.
  void raw(std::string_view bytes);
  // Hands everything on, and waits for a reader that is slow. Throws QVReaderGone where nobody
  // reads.
  void flush();

  // A line to standard error, which begins with the program's name.
  static void note(std::string_view text);

 private:
  const bool isJSON_;
  const int descriptor_;
  const bool isTerminal_;
  const bool isColoured_;
  QVJSONText jsonText_;
  std::string waiting_;
};
