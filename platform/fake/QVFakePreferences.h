#pragma once

#include "platform/QVPreferences.h"

#include <cstddef>
#include <map>
#include <mutex>
#include <string>

// Preferences for tests: a map that a test fills. A change shows at the next reading. Counts the
// readings, so that a test can tell who reads when.
//
// Threads: any.
class QVFakePreferences : public QVPreferences {
 public:
  QVDictionary valuesInDomain(std::string_view domain) override;

  void setValue(std::string_view domain, std::string_view key, QVValue value);
  void removeValue(std::string_view domain, std::string_view key);
  // Makes the domain hold these values and no others; an absent dictionary removes the domain.
  void setValues(std::string_view domain, const QVDictionary& values);

  std::size_t readingsOfDomain(std::string_view domain) const;

 private:
  using Values = std::map<std::string, QVValue, std::less<>>;

  mutable std::mutex mutex_;
  // Guarded by mutex_.
  std::map<std::string, Values, std::less<>> domains_;
  std::map<std::string, std::size_t, std::less<>> readings_;
};
