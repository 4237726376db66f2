#include "tools/qvctl/QVTimeText.h"

#include <array>
#include <charconv>
#include <cstdio>
#include <ctime>

namespace {

using std::chrono::microseconds;

// How far clocks are ahead of UTC or behind it anywhere.
constexpr int kLargestOffsetHours = 14;

constexpr int64_t kSecond = 1'000'000;
constexpr int64_t kMinute = 60 * kSecond;
constexpr int64_t kHour = 60 * kMinute;
constexpr int64_t kDay = 24 * kHour;
constexpr int64_t kLongest = 36'525 * kDay;

struct Unit {
  std::string_view name;
  int64_t length;
};
// Longer names first where one begins with another.
constexpr std::array<Unit, 7> kUnits{{{"ms", 1000},
                                      {"us", 1},
                                      {"s", kSecond},
                                      {"min", kMinute},
                                      {"m", kMinute},
                                      {"h", kHour},
                                      {"d", kDay}}};

// Takes a unit off the text; at its end, seconds.
std::optional<int64_t> takeUnit(std::string_view& text) {
  if (text.empty()) return kSecond;
  for (const Unit& unit : kUnits) {
    if (text.starts_with(unit.name)) {
      text.remove_prefix(unit.name.size());
      return unit.length;
    }
  }
  return std::nullopt;
}

// Takes so many digits off the text.
bool takeNumber(std::string_view& text, std::size_t digits, int& number) {
  if (text.size() < digits) return false;
  const auto [end, problem] = std::from_chars(text.data(), text.data() + digits, number);
  if (problem != std::errc() || end != text.data() + digits || text[0] == '-') return false;
  text.remove_prefix(digits);
  return true;
}

bool take(std::string_view& text, std::string_view beginning) {
  if (!text.starts_with(beginning)) return false;
  text.remove_prefix(beginning.size());
  return true;
}

bool take(std::string_view& text, char character) {
  return take(text, std::string_view(&character, 1));
}

// ".5" as microseconds; nothing is none.
bool takeFraction(std::string_view& text, int64_t& fraction) {
  fraction = 0;
  if (!take(text, '.')) return true;
  int64_t unit = kSecond / 10;
  std::size_t digits = 0;
  while (!text.empty() && text[0] >= '0' && text[0] <= '9') {
    fraction += (text[0] - '0') * unit;
    unit /= 10;
    ++digits;
    text.remove_prefix(1);
  }
  return digits > 0;
}

bool isClock(const tm& parts) {
  return parts.tm_hour < 24 && parts.tm_min < 60 && parts.tm_sec <= 60;
}

bool takeClock(std::string_view& text, tm& parts, int64_t& fraction) {
  if (!takeNumber(text, 2, parts.tm_hour) || !take(text, ':') ||
      !takeNumber(text, 2, parts.tm_min)) {
    return false;
  }
  if (take(text, ':') && !(takeNumber(text, 2, parts.tm_sec) && takeFraction(text, fraction))) {
    return false;
  }
  return isClock(parts);
}

// `between`: what parts its numbers.
bool takeDate(std::string_view& text, tm& parts, std::string_view between) {
  if (!takeNumber(text, 4, parts.tm_year) || !take(text, between) ||
      !takeNumber(text, 2, parts.tm_mon) || !take(text, between) ||
      !takeNumber(text, 2, parts.tm_mday)) {
    return false;
  }
  const std::chrono::year_month_day date{std::chrono::year(parts.tm_year),
                                         std::chrono::month(static_cast<unsigned>(parts.tm_mon)),
                                         std::chrono::day(static_cast<unsigned>(parts.tm_mday))};
  parts.tm_year -= 1900;
  parts.tm_mon -= 1;
  return date.ok();
}

tm midnight(int64_t now, int daysBefore) {
  const time_t seconds = now / kSecond;
  tm parts{};
  ::localtime_r(&seconds, &parts);
  parts.tm_hour = parts.tm_min = parts.tm_sec = 0;
  parts.tm_mday -= daysBefore;
  return parts;
}

int64_t local(tm parts, int64_t fraction = 0) {
  // Summer time is the system's to know.
  parts.tm_isdst = -1;
  return int64_t{::mktime(&parts)} * kSecond + fraction;  // NOLINT(concurrency-mt-unsafe)
}

// How far a time is ahead of UTC, to the end of the text: "+01:00", or without the colon.
std::optional<int64_t> parseOffset(std::string_view text) {
  const bool isWest = text.starts_with('-');
  int hours = 0;
  int minutes = 0;
  if (!(take(text, '+') || take(text, '-')) || !takeNumber(text, 2, hours)) return std::nullopt;
  take(text, ':');
  if (!takeNumber(text, 2, minutes) || !text.empty()) return std::nullopt;
  if (hours > kLargestOffsetHours || minutes > 59) return std::nullopt;
  const int64_t ahead = hours * kHour + minutes * kMinute;
  return isWest ? -ahead : ahead;
}

// A date, with a clock's time or without.
std::optional<int64_t> parseDate(std::string_view text) {
  tm parts{};
  int64_t fraction = 0;
  if (!takeDate(text, parts, "-")) return std::nullopt;
  if ((take(text, 'T') || take(text, ' ')) && !takeClock(text, parts, fraction)) {
    return std::nullopt;
  }
  if (take(text, 'Z') && text.empty()) return int64_t{::timegm(&parts)} * kSecond + fraction;
  if (text.empty()) return local(parts, fraction);
  const auto east = parseOffset(text);
  if (!east) return std::nullopt;
  return int64_t{::timegm(&parts)} * kSecond + fraction - *east;
}

std::string formatted(const tm& parts, const char* format, int64_t fraction) {
  char text[64];
  std::snprintf(text, sizeof text, format, parts.tm_year + 1900, parts.tm_mon + 1, parts.tm_mday,
                parts.tm_hour, parts.tm_min, parts.tm_sec, static_cast<int>(fraction));
  return text;
}

// Seconds and what is left over, which is never negative.
std::pair<time_t, int64_t> divided(int64_t time) {
  const int64_t fraction = (time % kSecond + kSecond) % kSecond;
  return {(time - fraction) / kSecond, fraction};
}

}  // namespace

std::optional<microseconds> QVParseDuration(std::string_view text) {
  if (text.empty()) return std::nullopt;
  double total = 0;
  while (!text.empty()) {
    double number = 0;
    const auto [end, problem] =
        std::from_chars(text.data(), text.data() + text.size(), number, std::chars_format::fixed);
    if (problem != std::errc() || !(number >= 0)) return std::nullopt;
    text.remove_prefix(static_cast<std::size_t>(end - text.data()));
    const auto unit = takeUnit(text);
    if (!unit) return std::nullopt;
    total += number * static_cast<double>(*unit);
  }
  if (!(total <= static_cast<double>(kLongest))) return std::nullopt;
  return microseconds(static_cast<int64_t>(total));
}

std::optional<int64_t> QVParseTime(std::string_view text, int64_t now) {
  if (text == "now") return now;
  if (text == "today") return local(midnight(now, 0));
  if (text == "yesterday") return local(midnight(now, 1));
  if (text.starts_with('@')) {
    double seconds = 0;
    const char* const end = text.data() + text.size();
    const auto [stop, problem] = std::from_chars(text.data() + 1, end, seconds);
    const bool isTime = problem == std::errc() && stop == end && seconds >= 0 && seconds < 1e11;
    if (!isTime) return std::nullopt;
    return static_cast<int64_t>(seconds * static_cast<double>(kSecond));
  }
  if (const auto date = parseDate(text)) return date;
  tm parts = midnight(now, 0);
  int64_t fraction = 0;
  std::string_view rest = text;
  if (takeClock(rest, parts, fraction) && rest.empty()) return local(parts, fraction);
  if (const auto before = QVParseDuration(text)) return now - before->count();
  return std::nullopt;
}

std::optional<int64_t> QVParseStamp(std::string_view text) {
  tm parts{};
  int hours = 0;
  int minutes = 0;
  const bool hasTime = takeDate(text, parts, "") && take(text, '-') &&
                       takeNumber(text, 2, parts.tm_hour) && takeNumber(text, 2, parts.tm_min) &&
                       takeNumber(text, 2, parts.tm_sec) && isClock(parts);
  const bool isWest = text.starts_with('-');
  if (!hasTime || !(take(text, '+') || take(text, '-'))) return std::nullopt;
  if (!takeNumber(text, 2, hours) || !takeNumber(text, 2, minutes) || !text.empty()) {
    return std::nullopt;
  }
  const int64_t east = hours * kHour + minutes * kMinute;
  return int64_t{::timegm(&parts)} * kSecond + (isWest ? east : -east);
}

int64_t QVTimeNow() {
  const auto now = std::chrono::system_clock::now().time_since_epoch();
  return std::chrono::duration_cast<microseconds>(now).count();
}

std::string QVLocalTimeText(int64_t time, bool precise) {
  const auto [seconds, fraction] = divided(time);
  tm parts{};
  ::localtime_r(&seconds, &parts);
  return formatted(parts,
                   precise ? "%04d-%02d-%02d %02d:%02d:%02d.%06d" : "%04d-%02d-%02d %02d:%02d:%02d",
                   fraction);
}

std::string QVUniversalTimeText(int64_t time) {
  const auto [seconds, fraction] = divided(time);
  tm parts{};
  ::gmtime_r(&seconds, &parts);
  return formatted(parts, "%04d-%02d-%02dT%02d:%02d:%02d.%06dZ", fraction);
}

std::string QVElapsedText(microseconds elapsed) {
  const int64_t count = elapsed.count();
  std::string text;
  const auto add = [&text](int64_t number, const char* unit) {
    if (!text.empty()) text.push_back(' ');
    text.append(std::to_string(number)).append(unit);
  };
  if (count >= kDay) {
    add(count / kDay, " d");
    add(count % kDay / kHour, " h");
  } else if (count >= kHour) {
    add(count / kHour, " h");
    add(count % kHour / kMinute, " min");
  } else if (count >= kMinute) {
    add(count / kMinute, " min");
  } else {
    add(count < 0 ? 0 : count / kSecond, " s");
  }
  return text;
}
