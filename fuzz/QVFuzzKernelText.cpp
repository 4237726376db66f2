#include "fuzz/QVFuzzFiles.h"
#include "platform/QVText.h"
#include "platform/linux/tally/QVKernelText.h"

#include <cstdlib>
#include <string>

namespace {

void require(bool condition) {
  if (!condition) std::abort();
}

}  // namespace

QVFuzzFileProgress QVFuzzKernelText(std::string_view input) {
  QVFuzzFileProgress progress;
  std::string_view rest = input;
  std::size_t bytes = 0;
  while (const auto line = QVKernelText::takeLine(rest)) {
    ++progress.items;
    bytes += line->size() + 1;
    // Memory of its own, so that a look beyond is seen.
    const std::string copy(*line);
    const auto counter = QVKernelText::parseLine(copy);
    if (!counter) continue;
    ++progress.accepted;
    require(!counter->key.empty() && counter->key.size() <= QVKernelText::kMaximumKeyBytes);
    require(copy.find(counter->key) != std::string::npos);
    const std::string plain = QVText(counter->key, ": ", counter->value);
    const auto again = QVKernelText::parseLine(plain);
    require(again && again->key == counter->key && again->value == counter->value);
  }
  require(bytes == input.size() || bytes == input.size() + 1);  // the last line may have no end
  return progress;
}
