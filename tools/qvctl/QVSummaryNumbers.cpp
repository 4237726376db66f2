#include "tools/qvctl/QVSummaryNumbers.h"

#include "QVServices/Statistics/QVReportingVocabulary.h"

#include <charconv>
#include <cmath>
#include <cstdlib>
#include <system_error>

namespace {

double numberOf(std::string_view digits) {
  double number = 0;
  const auto [end, problem] = std::from_chars(digits.data(), digits.data() + digits.size(), number);
  if (problem == std::errc()) return number;
  // Too large or too small. The locale is the one in which a point is a point.
  return std::strtod(std::string(digits).c_str(), nullptr);
}

}  // namespace

void QVSummaryNumbers::begin(Container container) {
  countMember();
  ++depth_;
  const bool isDictionary = container == Container::dictionary;
  if (depth_ == kMessageDepth - 1) isDictionary_ = isDictionary;
  if (depth_ != kMessageDepth) return;
  isMessage_ = isDictionary && isDictionary_ && members_ > 1;
  isSummaryEvent_ = false;
}

void QVSummaryNumbers::end(Container /*container*/) {
  if (depth_-- != kMessageDepth || !isMessage_) return;
  isMessage_ = false;
  if (!isSummaryEvent_) ++messages_;
}

void QVSummaryNumbers::key(std::string_view text) {
  if (depth_ != kMessageDepth || !isMessage_) return;
  key_ = text;
  if (text == kQVReportingSummaryEventKey) isSummaryEvent_ = true;
}

void QVSummaryNumbers::number(std::string_view digits) {
  countMember();
  if (depth_ == kMessageDepth && isMessage_) take(numberOf(digits));
}

void QVSummaryNumbers::boolean(bool value) {
  countMember();
  if (depth_ == kMessageDepth && isMessage_) take(value ? 1 : 0);
}

void QVSummaryNumbers::countMember() {
  if (depth_ == 1) ++members_;
}

void QVSummaryNumbers::take(double number) {
  if (std::isfinite(number)) receiver_(key_, messages_ + 1, number);
}
