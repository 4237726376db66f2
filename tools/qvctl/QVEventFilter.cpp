#include "tools/qvctl/QVEventFilter.h"

#include "QVServices/Statistics/QVReportingVocabulary.h"
#include "platform/QVText.h"
#include "tools/qvctl/QVTimeText.h"
#include "tools/qvctl/QVToolFailure.h"

#include <algorithm>
#include <charconv>

#include <fnmatch.h>

namespace {

// Parses each word, or says which one is wrong.
template <class Value, class Parse>
std::vector<Value> parseAll(const std::vector<std::string>& words, const char* what, Parse parse) {
  std::vector<Value> values;
  for (const std::string& word : words) {
    const auto value = parse(word);
    if (!value) {
      throw QVToolFailure(QVToolStatus::wrongUsage,
                          QVText("no ", what, " is called \"", word, "\""));
    }
    values.push_back(*value);
  }
  return values;
}

std::optional<int64_t> parseSession(std::string_view text) {
  int64_t session = 0;
  const char* const end = text.data() + text.size();
  const auto [stop, problem] = std::from_chars(text.data(), end, session);
  if (problem != std::errc() || stop != end) return std::nullopt;
  return session;
}

std::optional<int64_t> parseTime(const std::optional<std::string>& text, int64_t now) {
  if (!text) return std::nullopt;
  const auto time = QVParseTime(*text, now);
  if (!time) {
    throw QVToolFailure(QVToolStatus::wrongUsage,
                        QVText("\"", *text, "\" is no time and no duration"));
  }
  return time;
}

template <class Value>
bool allows(const std::vector<Value>& wanted, const std::optional<Value>& value) {
  if (wanted.empty()) return true;
  return value && std::ranges::find(wanted, *value) != wanted.end();
}

}  // namespace

QVEventFilter::QVEventFilter() {
  kinds_.fill(true);
}

QVEventFilter::QVEventFilter(const Words& words, int64_t now)
    : sessions_(parseAll<int64_t>(words.sessions, "session", parseSession)),
      categories_(
          parseAll<QVCategoryPattern>(words.categories, "category", QVCategoryPattern::parse)),
      types_(parseAll<uint16_t>(words.types, "message type", QVParseMessageType)),
      names_(words.names),
      since_(parseTime(words.since, now)),
      until_(parseTime(words.until, now)) {
  kinds_.fill(words.kinds.empty());
  for (const auto kind :
       parseAll<QVStoredEvent::Kind>(words.kinds, "kind of event", QVStoredEvent::kindNamed)) {
    kinds_[static_cast<std::size_t>(kind)] = true;
  }
  for (const uint16_t type :
       parseAll<uint16_t>(words.services, "service type", QVParseServiceType)) {
    services_.push_back(QVText(QVReportingServiceTypeName(type)));
  }
}

bool QVEventFilter::wants(const QVStoredEvent& event) const {
  if (!wants(event.kind)) return false;
  if ((since_ && event.time < *since_) || (until_ && event.time > *until_)) return false;
  if (!allows(sessions_, event.session) || !allows(types_, event.type)) return false;
  if (!services_.empty() && std::ranges::find(services_, event.service) == services_.end()) {
    return false;
  }
  if (!categories_.empty() && !wantsCategory(event)) return false;
  if (names_.empty()) return true;
  return !event.name.empty() && std::ranges::any_of(names_, [&event](const std::string& pattern) {
    return ::fnmatch(pattern.c_str(), event.name.c_str(), FNM_CASEFOLD) == 0;
  });
}

bool QVEventFilter::wantsCategory(const QVStoredEvent& event) const {
  if (!event.category) return false;
  const bool isKindAlone = event.kind == QVStoredEvent::Kind::message;
  return std::ranges::any_of(categories_, [&](const QVCategoryPattern& pattern) {
    return isKindAlone ? pattern.matchesKind(static_cast<uint16_t>(*event.category))
                       : pattern.matches(*event.category);
  });
}
