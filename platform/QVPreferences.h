#pragma once

#include "platform/QVValue.h"

#include <optional>
#include <string>
#include <string_view>

// The platform's preferences store: values by key within a named domain, read afresh at each
// call, so that a change shows at the next reading.
//
// Threads: any, at once. May read a file, so not for a hot path. A domain that is missing or
// cannot be read counts as empty, but for want of descriptors or memory as what was last read of
// it; the adapter logs why.
class QVPreferences {
 public:
  virtual ~QVPreferences() = default;
  // Everything in the domain; absent where there is no such domain.
  virtual QVDictionary valuesInDomain(std::string_view domain) = 0;

  // Readings of one value, as preferences are read everywhere.
  //
  // True for a boolean true, a number other than 0, and "true", "yes" or "1" in any case; false
  // for anything else, an absent value included.
  static bool booleanReading(const QVValue* value);
  // A string as it is, a number's text; nothing for containers and absent values.
  static std::optional<std::string> stringReading(const QVValue* value);
};
