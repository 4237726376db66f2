#pragma once

#include "QVServices/Statistics/Service/QVReportingPayloadArray.h"

#include <string>
#include <utility>
#include <vector>

// What tests read of payload stores and arrays, as values of their own.

inline QVDictionary dictionaryOf(const QVReportingPayloadStore::Payload& payload) {
  std::vector<QVDictionaryEntry> entries(payload.entries.begin(), payload.entries.end());
  return QVDictionary::assemble(entries);
}

inline QVDictionary payloadAt(const QVReportingPayloadStore& store,
                              QVReportingPayloadStore::Position position) {
  std::vector<QVDictionaryEntry> room;
  return dictionaryOf(store.read(position, room));
}

// Identifiers and payloads, in order.
inline std::vector<std::pair<std::string, QVDictionary>> entriesOf(
    const QVReportingPayloadArray& array) {
  std::vector<std::pair<std::string, QVDictionary>> entries;
  array.forEach(
      [&entries](std::string_view identifier, const QVReportingPayloadArray::Payload& payload) {
        entries.emplace_back(identifier, dictionaryOf(payload));
      });
  return entries;
}
