#include "platform/linux/files/QVJSONFile.h"

#include "platform/QVText.h"
#include "platform/linux/files/QVRegularFile.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <system_error>
#include <utility>
#include <vector>

#include <locale.h>
#include <rapidjson/error/en.h>
#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>
#include <stdlib.h>

namespace {

// The value of a number's text, which the reader has checked; absent where no double is so large.
// (The reader's own conversion takes 2e308 for infinity and ends the process for 581e308.)
QVValue number(std::string_view text) {
  const char* const end = text.data() + text.size();
  if (text.find_first_of(".eE") == std::string_view::npos) {
    int64_t whole = 0;
    if (std::from_chars(text.data(), end, whole).ec == std::errc()) return whole;
    uint64_t natural = 0;
    if (std::from_chars(text.data(), end, natural).ec == std::errc()) return natural;
  }
  double real = 0;
  if (std::from_chars(text.data(), end, real).ec == std::errc()) return real;
  // Too large or too small, wherever the program's locale has its point. This locale needs no
  // memory.
  static const locale_t plain = ::newlocale(LC_ALL_MASK, "C", nullptr);
  real = ::strtod_l(std::string(text).c_str(), nullptr, plain);
  return std::isfinite(real) ? QVValue(real) : QVValue();
}

// Builds values from the reader's events. Answering false ends the parse.
class Builder {
 public:
  bool Null() { return add({}); }
  bool Bool(bool value) { return add(value); }
  // Numbers come as their text (kParseNumbersAsStringsFlag), so these are never called.
  bool Int(int) { return false; }
  bool Uint(unsigned) { return false; }
  bool Int64(int64_t) { return false; }
  bool Uint64(uint64_t) { return false; }
  bool Double(double) { return false; }
  bool RawNumber(const char* text, rapidjson::SizeType length, bool) {
    const QVValue value = number({text, length});
    if (value.isAbsent()) {
      refusal_ = rapidjson::GetParseError_En(rapidjson::kParseErrorNumberTooBig);
    }
    return refusal_.empty() && add(value);
  }
  bool String(const char* text, rapidjson::SizeType length, bool) {
    return isPaired({text, length}) && add(std::string_view(text, length));
  }
  bool Key(const char* text, rapidjson::SizeType length, bool) {
    open_.back().keys.emplace_back(text, length);
    return isPaired({text, length});
  }
  bool StartObject() { return begin(); }
  bool StartArray() { return begin(); }
  bool EndObject(rapidjson::SizeType) {
    const Container container = end();
    std::vector<QVDictionaryEntry> entries;
    entries.reserve(container.keys.size());
    for (std::size_t i = 0; i < container.keys.size(); ++i) {
      entries.push_back({container.keys[i], container.values[i]});
    }
    return add(QVDictionary::assemble(entries));
  }
  bool EndArray(rapidjson::SizeType) { return add(QVArray::assemble(end().values)); }

  // Why it ended the parse; empty where it did not.
  const std::string& refusal() const { return refusal_; }
  QVValue takeResult() { return std::move(result_); }

 private:
  struct Container {
    std::vector<std::string> keys;
    std::vector<QVValue> values;
  };

  bool begin() {
    if (open_.size() >= QVJSONFile::kMaximumDepth) {
      refusal_ = QVText("nested deeper than ", QVJSONFile::kMaximumDepth);
      return false;
    }
    open_.emplace_back();
    return true;
  }
  // The reader makes a character of a second surrogate's escape that has no first one before it.
  bool isPaired(std::string_view text) {
    for (std::size_t at = text.find('\xED'); at != std::string_view::npos;
         at = text.find('\xED', at + 1)) {
      if (static_cast<unsigned char>(text[at + 1]) < 0xA0) continue;
      refusal_ = rapidjson::GetParseError_En(rapidjson::kParseErrorStringUnicodeSurrogateInvalid);
      return false;
    }
    return true;
  }
  Container end() {
    Container container = std::move(open_.back());
    open_.pop_back();
    return container;
  }
  bool add(QVValue value) {
    (open_.empty() ? result_ : open_.back().values.emplace_back()) = std::move(value);
    return true;
  }

  std::vector<Container> open_;
  QVValue result_;
  std::string refusal_;
};

std::optional<std::string> contents(const std::string& path, QVJSONFailure& failure) {
  const QVRegularFile file(path, QVRegularFile::Links::follow);
  std::string text;
  int error = file.error();
  if (error == 0) error = file.read(QVJSONFile::kMaximumBytes, text);
  if (error == 0) return text;
  failure = {.reason = QVRegularFile::reason(error, QVJSONFile::kMaximumBytes),
             .missing = error == ENOENT || error == ENOTDIR,
             .passing = error == EMFILE || error == ENFILE || error == ENOMEM};
  return std::nullopt;
}

}  // namespace

std::string QVJSONFailure::description() const {
  return line == 0 ? reason : QVText("line ", line, ", column ", column, ": ", reason);
}

std::optional<QVValue> QVJSONFile::parse(std::string_view text, QVJSONFailure& failure) {
  constexpr unsigned kFlags = rapidjson::kParseIterativeFlag |
                              rapidjson::kParseNumbersAsStringsFlag |
                              rapidjson::kParseValidateEncodingFlag;
  rapidjson::MemoryStream stream(text.data(), text.size());
  rapidjson::Reader reader;
  Builder builder;
  rapidjson::ParseResult result = reader.Parse<kFlags>(stream, builder);
  // The reader takes a NUL for the text's end.
  if (!result.IsError() && stream.Tell() != text.size()) {
    result.Set(rapidjson::kParseErrorDocumentRootNotSingular, stream.Tell());
  }
  if (!result.IsError()) return builder.takeResult();
  const std::string_view before = text.substr(0, std::min(result.Offset(), text.size()));
  const std::size_t lineStart = before.rfind('\n') + 1;  // 0 where there is none
  failure = {.reason = builder.refusal().empty() ? rapidjson::GetParseError_En(result.Code())
                                                 : builder.refusal(),
             .line = static_cast<std::size_t>(std::ranges::count(before, '\n')) + 1,
             .column = before.size() - lineStart + 1};
  return std::nullopt;
}

std::optional<QVValue> QVJSONFile::read(const std::string& path, QVJSONFailure& failure) {
  const std::optional<std::string> text = contents(path, failure);
  return text ? parse(*text, failure) : std::nullopt;
}

std::optional<QVDictionary> QVJSONFile::readDictionary(const std::string& path,
                                                       QVJSONFailure& failure) {
  const std::optional<QVValue> value = read(path, failure);
  if (!value) return std::nullopt;
  if (value->kind() != QVValue::Kind::dictionary) {
    failure = {.reason = "not an object", .line = 1, .column = 1};
    return std::nullopt;
  }
  return value->dictionary();
}
