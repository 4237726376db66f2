#include "platform/linux/QVJSONText.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <string>

#include <rapidjson/prettywriter.h>
#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>

namespace {

// A buffer that one large text has grown beyond this is given back, in bytes.
constexpr std::size_t kKeptBufferBytes = std::size_t{256} * 1024;

// Below this every whole number is a double of its own.
constexpr double kWholeNumbers = 0x1p53;

constexpr std::string_view kReplacement = "\xEF\xBF\xBD";

// What stands at the beginning of `bytes`: a whole character, or the longest piece of one that
// still could have become a character (at least one byte).
struct Sequence {
  std::size_t length;
  bool valid;
};

Sequence sequenceAt(std::string_view bytes) {
  const auto at = [&bytes](std::size_t i) { return static_cast<unsigned char>(bytes[i]); };
  const unsigned char lead = at(0);
  if (lead < 0x80) return {1, true};
  if (lead < 0xC2 || lead > 0xF4) return {1, false};
  const std::size_t length = lead < 0xE0 ? 2 : lead < 0xF0 ? 3 : 4;
  // The second byte's range keeps out overlong forms, surrogates and what lies above U+10FFFF.
  unsigned char low = 0x80;
  unsigned char high = 0xBF;
  if (lead == 0xE0) low = 0xA0;
  if (lead == 0xED) high = 0x9F;
  if (lead == 0xF0) low = 0x90;
  if (lead == 0xF4) high = 0x8F;
  for (std::size_t i = 1; i < length; ++i) {
    if (i >= bytes.size() || at(i) < low || at(i) > high) return {i, false};
    low = 0x80;
    high = 0xBF;
  }
  return {length, true};
}

std::size_t validPrefix(std::string_view bytes) {
  std::size_t i = 0;
  while (i < bytes.size()) {
    const Sequence sequence = sequenceAt(bytes.substr(i));
    if (!sequence.valid) return i;
    i += sequence.length;
  }
  return i;
}

// Is there a byte in the word that JSON escapes, or that is not ASCII? May say yes to a word that
// has none, never no to one that has. The usual trick: taking 1 from a zero byte sets its top bit.
constexpr bool mayNeedCare(uint64_t word) {
  constexpr uint64_t kOnes = 0x0101010101010101;
  constexpr uint64_t kTops = 0x8080808080808080;
  const uint64_t quotes = word ^ (kOnes * '"');
  const uint64_t backslashes = word ^ (kOnes * '\\');
  return ((word | (word - kOnes * 0x20) | (quotes - kOnes) | (backslashes - kOnes)) & kTops) != 0;
}

// Printable ASCII without quotes and backslashes: nearly all text is, and is copied as it is.
bool isPlain(std::string_view text) {
  uint64_t word = 0;
  std::size_t i = 0;
  for (; i + sizeof word <= text.size(); i += sizeof word) {
    std::memcpy(&word, text.data() + i, sizeof word);
    if (mayNeedCare(word)) return false;
  }
  word = 0x2020202020202020;
  if (i < text.size()) std::memcpy(&word, text.data() + i, text.size() - i);
  return !mayNeedCare(word);
}

std::string repaired(std::string_view bytes) {
  std::string text;
  while (!bytes.empty()) {
    const std::size_t valid = validPrefix(bytes);
    text.append(bytes.substr(0, valid));
    bytes.remove_prefix(valid);
    if (bytes.empty()) break;
    text.append(kReplacement);
    bytes.remove_prefix(sequenceAt(bytes).length);
  }
  return text;
}

// RapidJSON's writers look at each character of a string; these copy the ones that need no look.
class CompactWriter : public rapidjson::Writer<rapidjson::StringBuffer> {
 public:
  using Writer::Writer;

  bool plainString(std::string_view text) {
    Prefix(rapidjson::kStringType);
    char* place = os_->Push(text.size() + 2);
    *place++ = '"';
    place = std::copy(text.begin(), text.end(), place);
    *place = '"';
    return EndValue(true);
  }
};

class PrettyWriter : public rapidjson::PrettyWriter<rapidjson::StringBuffer> {
 public:
  using rapidjson::PrettyWriter<rapidjson::StringBuffer>::PrettyWriter;

  bool plainString(std::string_view text) {
    return String(text.data(), static_cast<rapidjson::SizeType>(text.size()));
  }
};

template <class Writer>
class Streamer {
 public:
  Streamer(Writer& writer, bool quoteNonFinite)
      : writer_(writer), quoteNonFinite_(quoteNonFinite) {}

  bool value(const QVValue& value) {
    switch (value.kind()) {
      case QVValue::Kind::absent:
        return writer_.Null();
      case QVValue::Kind::boolean:
        return writer_.Bool(value.boolean());
      case QVValue::Kind::integer:
        return writer_.Int64(value.integer());
      case QVValue::Kind::unsignedInteger:
        return writer_.Uint64(value.unsignedInteger());
      case QVValue::Kind::real:
        return real(value.real());
      case QVValue::Kind::string:
        return string(value.string());
      case QVValue::Kind::array:
        return array(value.array());
      case QVValue::Kind::dictionary:
        return dictionary(value.dictionary());
    }
    return false;
  }

  bool dictionary(const QVDictionary& dictionary) {
    writer_.StartObject();
    for (const QVDictionaryEntry& entry : dictionary) {
      if (!string(entry.key) || !value(entry.value)) return false;
    }
    return writer_.EndObject();
  }

 private:
  bool array(const QVArray& array) {
    writer_.StartArray();
    for (const QVValue& item : array) {
      if (!value(item)) return false;
    }
    return writer_.EndArray();
  }

  bool string(std::string_view text) {
    if (text.empty()) return writer_.plainString("");
    if (isPlain(text)) return writer_.plainString(text);
    if (validPrefix(text) == text.size()) return escaped(text);
    return escaped(repaired(text));
  }

  bool escaped(std::string_view text) {
    return writer_.String(text.data(), static_cast<rapidjson::SizeType>(text.size()));
  }

  bool real(double number) {
    if (!std::isfinite(number)) {
      if (!quoteNonFinite_) return false;
      return string(std::isnan(number) ? "nan" : number < 0 ? "-inf" : "inf");
    }
    std::array<char, 64> text;
    char* end = text.data();
    const double magnitude = std::fabs(number);
    if (magnitude >= 1 && magnitude < kWholeNumbers && number == std::trunc(number)) {
      // The same digits, found faster.
      end = std::to_chars(end, end + text.size(), static_cast<int64_t>(number)).ptr;
    } else {
      const bool fixed = number == 0 || (magnitude >= 1e-4 && magnitude < 1e17);
      end = std::to_chars(end, end + text.size(), number,
                          fixed ? std::chars_format::fixed : std::chars_format::scientific)
                .ptr;
    }
    if (std::none_of(text.data(), end, [](char c) { return c == '.' || c == 'e'; })) {
      *end++ = '.';
      *end++ = '0';
    }
    return writer_.RawValue(text.data(), static_cast<std::size_t>(end - text.data()),
                            rapidjson::kNumberType);
  }

  Writer& writer_;
  const bool quoteNonFinite_;
};

}  // namespace

struct QVJSONText::State {
  State(Layout chosenLayout, NonFinite chosenNonFinite)
      : layout(chosenLayout), nonFinite(chosenNonFinite) {
    pretty.SetIndent(' ', 2);
  }

  const Layout layout;
  const NonFinite nonFinite;
  rapidjson::StringBuffer buffer;
  CompactWriter compact{buffer};
  PrettyWriter pretty{buffer};

  void clear() {
    const bool large = buffer.GetSize() > kKeptBufferBytes;
    buffer.Clear();
    if (large) buffer.ShrinkToFit();
  }

  template <class Part>
  std::optional<std::string_view> write(Part part) {
    clear();
    return layout == Layout::compact ? write(compact, part) : write(pretty, part);
  }

  template <class Writer, class Part>
  std::optional<std::string_view> write(Writer& writer, Part part) {
    writer.Reset(buffer);
    Streamer<Writer> streamer(writer, nonFinite == NonFinite::quote);
    if (!part(streamer)) return std::nullopt;
    return std::string_view(buffer.GetString(), buffer.GetSize());
  }
};

QVJSONText::QVJSONText(Layout layout, NonFinite nonFinite)
    : state_(std::make_unique<State>(layout, nonFinite)) {}

QVJSONText::~QVJSONText() = default;

void QVJSONText::clear() {
  state_->clear();
}

std::optional<std::string_view> QVJSONText::write(const QVValue& value) {
  return state_->write([&value](auto& streamer) { return streamer.value(value); });
}

std::optional<std::string_view> QVJSONText::write(const QVDictionary& value) {
  return state_->write([&value](auto& streamer) { return streamer.dictionary(value); });
}
