#include "QVServices/Statistics/Service/QVReportingPayloads.h"

#include <algorithm>
#include <string>
#include <vector>

QVDictionary QVReportingNormalisedPayload(const QVDictionary& message) {
  const auto hasBlank = [](const QVDictionaryEntry& entry) {
    return entry.key.find(' ') != std::string_view::npos;
  };
  if (std::none_of(message.begin(), message.end(), hasBlank)) return message;

  std::vector<std::string> keys;
  keys.reserve(message.size());  // entries refer to the keys in place
  std::vector<QVDictionaryEntry> entries;
  entries.reserve(message.size());
  for (const auto& entry : message) {
    std::string& key = keys.emplace_back(entry.key);
    std::ranges::replace(key, ' ', '_');
    entries.push_back({key, entry.value});
  }
  return QVDictionary::assemble(entries, message.charge());
}
