#pragma once

#include "platform/QVLog.h"

#include <string>
#include <string_view>

// One line on its way to where the log goes.
struct QVLogLine {
  // How the default log is called where a scope's name stands.
  static constexpr std::string_view kDefaultScope = "default";

  const QVLogScope* scope = nullptr;
  QVLogLevel level = QVLogLevel::standard;
  const char* function = "";
  const char* file = "";  // without directories
  uint32_t line = 0;
  std::string text;

  std::string_view scopeName() const {
    return scope == nullptr ? kDefaultScope : std::string_view(scope->name);
  }
};

// Appends `text` such that it is one line of valid UTF-8: control characters become \n, \r, \t,
// \xNN or (of Unicode's own) \u00NN, bytes that are no UTF-8 \xNN. Everything else, "\" included,
// stays.
void QVAppendLogText(std::string& out, std::string_view text);
