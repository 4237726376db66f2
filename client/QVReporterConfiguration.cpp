#include "client/QVReporterConfiguration.h"

#include "platform/linux/bus/QVBusReader.h"
#include "platform/linux/bus/QVBusSignature.h"

#include <algorithm>
#include <cstddef>
#include <vector>

namespace {

// Where entries begin, so that they can be moved from one such place to another.
constexpr std::size_t kEntryAlignment = 8;

struct Entry {
  std::string_view key;
  std::string_view bytes;
};

std::vector<Entry> entriesOf(std::string_view payload) {
  std::vector<Entry> entries;
  QVBusReader reader(payload, false);
  while (reader.ok() && !reader.atEnd()) {
    reader.align(kEntryAlignment);
    const std::size_t begin = reader.position();
    const std::string_view key = reader.readString();
    QVBusSignature signature;
    const std::string_view type = reader.enterVariantText();
    if (reader.parseVariantSignature(type, signature)) reader.skipValue(signature, 0);
    reader.leaveVariant();
    entries.push_back({key, payload.substr(begin, reader.position() - begin)});
  }
  return entries;
}

}  // namespace

std::string QVReporterMergedConfiguration(std::string_view earlier, std::string_view later) {
  std::vector<Entry> entries = entriesOf(earlier);
  for (const Entry& entry : entriesOf(later)) {
    std::erase_if(entries, [&entry](const Entry& other) { return other.key == entry.key; });
    entries.push_back(entry);
  }
  std::string merged;
  for (const Entry& entry : entries) {
    merged.resize((merged.size() + kEntryAlignment - 1) / kEntryAlignment * kEntryAlignment);
    merged.append(entry.bytes);
  }
  return merged;
}
