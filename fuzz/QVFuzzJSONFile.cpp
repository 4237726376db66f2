#include "fuzz/QVFuzzFiles.h"
#include "platform/linux/files/QVJSONFile.h"
#include "platform/linux/store/QVJSONText.h"

#include <cstdlib>
#include <string>

namespace {

void require(bool condition) {
  if (!condition) std::abort();
}

std::size_t values(const QVValue& value) {
  std::size_t count = 1;
  if (value.kind() == QVValue::Kind::array) {
    for (const QVValue& item : value.array()) count += values(item);
  } else if (value.kind() == QVValue::Kind::dictionary) {
    for (const QVDictionaryEntry& entry : value.dictionary()) count += values(entry.value);
  }
  return count;
}

}  // namespace

QVFuzzFileProgress QVFuzzJSONFile(std::string_view input) {
  QVJSONFailure failure;
  const auto value = QVJSONFile::parse(input, failure);
  if (!value) {
    require(!failure.reason.empty() && failure.line > 0 && failure.column > 0);
    require(failure.column <= input.size() + 1);
    return {};
  }
  QVJSONText text;
  const auto again = QVJSONFile::parse(text.write(*value), failure);
  require(again && *again == *value);
  return {.accepted = 1, .items = values(*value)};
}
