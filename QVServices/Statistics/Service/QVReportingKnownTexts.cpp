#include "QVServices/Statistics/Service/QVReportingKnownTexts.h"

namespace {

// The set's own for each text: its node's link and hash, its place in the table.
constexpr std::size_t kNodeBytes = sizeof(std::string) + 3 * sizeof(void*);

}  // namespace

const std::string* QVReportingKnownTexts::keep(std::string_view text) {
  if (text.size() < kShortest || text.size() > kLongest) return nullptr;
  auto known = texts_.find(text);
  if (known == texts_.end()) {
    if (texts_.size() == kMaximumTexts) return nullptr;
    known = texts_.emplace(text).first;
    footprint_ += kNodeBytes + text.size();
  }
  writtenOut_ += text.size();
  return &*known;
}
