#include "tools/qvctl/QVNames.h"

#include "QVServices/Statistics/QVReportingVocabulary.h"

#include <algorithm>
#include <charconv>
#include <cstdio>

namespace {

constexpr uint32_t kComponents = kQVReportingCategoryComponentMask;
constexpr uint32_t kKinds = kQVReportingCategoryKindMask;

constexpr uint32_t kFirstComponent = 0x00010000;
// The vocabulary answers this for kinds and types that it does not know.
constexpr std::string_view kUndefined = "Undefined";
constexpr uint16_t kSummaryKind = kQVReportingCategorySummary & kKinds;
constexpr std::string_view kSummary = "Summary";

bool equals(std::string_view one, std::string_view other) {
  const auto lower = [](char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c | 0x20) : c; };
  return std::ranges::equal(one, other, {}, lower, lower);
}

template <class Number>
std::optional<Number> parseNumber(std::string_view text) {
  int base = 10;
  if (text.starts_with("0x") || text.starts_with("0X")) {
    base = 16;
    text.remove_prefix(2);
  }
  Number number = 0;
  const char* const end = text.data() + text.size();
  const auto [stop, problem] = std::from_chars(text.data(), end, number, base);
  if (problem != std::errc() || stop != end) return std::nullopt;
  return number;
}

std::string kindName(uint32_t kind) {
  std::string name = QVReportingCategoryName(kind);
  if (kind != 0 && name == kUndefined) name.clear();
  return name;
}

// Empty where there is none.
std::string componentName(uint32_t component) {
  const std::string name = QVReportingCategoryName(component);
  return name.substr(0, name.find('_'));
}

std::optional<uint32_t> kindNamed(std::string_view name) {
  if (equals(name, kSummary)) return kSummaryKind;
  // The kinds that have names follow one another.
  for (uint32_t kind = 0; kind <= kKinds; ++kind) {
    const std::string known = kindName(kind);
    if (known.empty()) return std::nullopt;
    if (equals(name, known)) return kind;
  }
  return std::nullopt;
}

std::optional<uint32_t> componentNamed(std::string_view name) {
  if (name.empty()) return std::nullopt;
  for (uint32_t component = kFirstComponent; component != 0; component <<= 1U) {
    if (equals(name, componentName(component))) return component;
  }
  return std::nullopt;
}

}  // namespace

std::string QVServiceTypeText(uint16_t serviceType) {
  const auto name = QVReportingServiceTypeName(serviceType);
  return name ? std::string(*name) : std::to_string(serviceType);
}

std::optional<uint16_t> QVParseServiceType(std::string_view text) {
  if (const auto number = parseNumber<uint16_t>(text)) return number;
  for (uint32_t type = 0; type <= kQVReportingServiceTypeUnknown; ++type) {
    const auto name = QVReportingServiceTypeName(static_cast<uint16_t>(type));
    if (name && equals(text, *name)) return static_cast<uint16_t>(type);
  }
  return std::nullopt;
}

std::string QVKindText(uint16_t kind) {
  if (kind == kSummaryKind) return std::string(kSummary);
  const std::string name = kindName(kind);
  return name.empty() ? std::to_string(kind) : name;
}

std::string QVCategoryText(uint32_t category) {
  if (category == kQVReportingCategorySummary) return std::string(kSummary);
  const std::string kind = kindName(category & kKinds);
  if (category < kFirstComponent) return QVKindText(static_cast<uint16_t>(category));
  std::string name = componentName(category & kComponents);
  if (!name.empty() && !kind.empty()) return name.append(".").append(kind);
  char number[16];
  std::snprintf(number, sizeof number, "0x%08X", category);
  return number;
}

std::optional<uint32_t> QVParseCategory(std::string_view text) {
  if (const auto number = parseNumber<uint32_t>(text)) return number;
  if (equals(text, kSummary)) return kQVReportingCategorySummary;
  const std::size_t end = text.find_first_of("._");
  if (end == std::string_view::npos) return kindNamed(text);
  const auto component = componentNamed(text.substr(0, end));
  const auto kind = kindNamed(text.substr(end + 1));
  if (!component || !kind) return std::nullopt;
  return *component | *kind;
}

std::string QVMessageTypeText(uint16_t type) {
  const std::string_view name = QVReportingMessageTypeName(type);
  return name == kUndefined ? std::to_string(type) : std::string(name);
}

std::optional<uint16_t> QVParseMessageType(std::string_view text) {
  if (const auto number = parseNumber<uint16_t>(text)) return number;
  for (uint32_t type = 0; type <= UINT16_MAX; ++type) {
    const std::string_view name = QVReportingMessageTypeName(static_cast<uint16_t>(type));
    if (name != kUndefined && equals(text, name)) return static_cast<uint16_t>(type);
  }
  return std::nullopt;
}

bool QVCategoryPattern::matchesKind(uint16_t kind) const {
  return (mask & kKinds) == 0 || kind == (word & kKinds);
}

std::optional<QVCategoryPattern> QVCategoryPattern::parse(std::string_view text) {
  if (const auto component = componentNamed(text)) {
    return QVCategoryPattern{*component, kComponents};
  }
  const auto category = QVParseCategory(text);
  if (!category) return std::nullopt;
  const bool isKind = *category <= kKinds;
  return QVCategoryPattern{*category, isKind ? kKinds : UINT32_MAX};
}
