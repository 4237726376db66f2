#pragma once

#include <string_view>

// Receives what JSON text consists of, in the order in which it stands there, from
// QVScanJSONArray(). Implemented for what is looked for, the rest is passed over.
//
// Threads: that of the scan. The views are valid during the call.
class QVJSONReceiver {
 public:
  enum class Container { array, dictionary };

  virtual ~QVJSONReceiver() = default;

  virtual void begin(Container /*container*/) {}
  virtual void end(Container /*container*/) {}
  virtual void key(std::string_view /*text*/) {}
  virtual void string(std::string_view /*text*/) {}
  // As it is written.
  virtual void number(std::string_view /*digits*/) {}
  virtual void boolean(bool /*value*/) {}
  virtual void null() {}
};
