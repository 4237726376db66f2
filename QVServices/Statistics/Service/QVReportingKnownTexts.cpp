#include "QVServices/Statistics/Service/QVReportingKnownTexts.h"

namespace {

// The set's own for each text: its node's link and hash, its place in the table.
constexpr std::size_t kNodeBytes = sizeof(std::string) + 3 * sizeof(void*);

}  // namespace

const std::string* QVReportingKnownTexts::keep(std::string_view text) {
  if (text.size() < kShortest || text.size() > kLongest) return nullptr;
  if (const auto known = texts_.find(text); known != texts_.end()) return &*known;
  if (texts_.size() == kMaximumTexts) return nullptr;
  bytes_ += kNodeBytes + text.size();
  return &*texts_.emplace(text).first;
}
