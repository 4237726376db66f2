#include "tools/qvctl/QVStoredEvent.h"

#include "platform/linux/files/QVJSONFile.h"
#include "tools/qvctl/QVNames.h"
#include "tools/qvctl/QVTimeText.h"

#include <algorithm>
#include <utility>
#include <vector>

namespace {

constexpr std::array<std::string_view, QVStoredEvent::kKinds> kKindNames{
    "start", "message", "analytics", "energy", "stop", "loss"};

// The value of stored JSON text; the text itself where it is none, or nested too deeply.
QVValue valueOf(const std::string& text) {
  QVJSONFailure failure;
  auto value = QVJSONFile::parse(text, failure);
  return value ? *std::move(value) : QVValue(text);
}

}  // namespace

std::string_view QVStoredEvent::kindName(Kind kind) {
  return kKindNames[static_cast<std::size_t>(kind)];
}

std::optional<QVStoredEvent::Kind> QVStoredEvent::kindNamed(std::string_view name) {
  const auto* const found = std::ranges::find(kKindNames, name);
  if (found == kKindNames.end()) return std::nullopt;
  return static_cast<Kind>(found - kKindNames.begin());
}

std::string QVStoredEvent::categoryText() const {
  if (!category) return {};
  const bool isKindAlone = kind == Kind::message;
  return isKindAlone ? QVKindText(static_cast<uint16_t>(*category)) : QVCategoryText(*category);
}

std::string QVStoredEvent::typeText() const {
  return type ? QVMessageTypeText(*type) : std::string();
}

QVValue QVStoredEvent::json() const {
  std::vector<QVDictionaryEntry> entries;
  const auto add = [&entries](std::string_view key, QVValue value) {
    entries.push_back({key, std::move(value)});
  };
  add("kind", kindName(kind));
  add("id", id);
  add("time", QVUniversalTimeText(time));
  if (session) add("session", *session);
  if (!service.empty()) {
    add("service", service);
    if (const auto number = QVParseServiceType(service)) add("serviceType", *number);
  }
  if (category) {
    add("category", *category);
    add("categoryName", categoryText());
  }
  if (type) {
    add("type", *type);
    add("typeName", typeText());
  }
  if (kind == Kind::loss) {
    add("cause", name);
    add("count", count);
  } else if (!name.empty()) {
    add("name", name);
  }
  if (!payload.empty()) add(kind == Kind::start ? "userInfo" : "payload", valueOf(payload));
  return QVDictionary::assemble(entries);
}
