#include "platform/linux/settings/QVJSONPreferences.h"

#include <algorithm>
#include <utility>

QVJSONPreferences::QVJSONPreferences(QVLog& log, std::string directory)
    : files_(log, "preferences"), directory_(std::move(directory)) {}

QVDictionary QVJSONPreferences::valuesInDomain(std::string_view domain) {
  std::string name(domain);
  std::ranges::replace_if(
      name, [](char c) { return c == '/' || c == '\0'; }, '_');
  return files_.read(directory_ + '/' + name + ".json", "-[QVJSONPreferences valuesInDomain:]");
}
