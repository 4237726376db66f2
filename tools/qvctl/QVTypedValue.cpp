#include "tools/qvctl/QVTypedValue.h"

#include "platform/QVText.h"
#include "platform/linux/files/QVJSONFile.h"
#include "platform/linux/files/QVRegularFile.h"
#include "tools/qvctl/QVToolFailure.h"

#include <array>
#include <cerrno>
#include <charconv>
#include <cmath>
#include <optional>

#include <unistd.h>

namespace {

// What the wire takes in one message.
constexpr std::size_t kMaximumBytes = std::size_t{8} << 20;

QVToolFailure wrong(std::string_view entry, std::string_view reason) {
  return {QVToolStatus::wrongUsage, QVText(entry, ": ", reason)};
}

template <class Number>
std::optional<Number> parseNumber(std::string_view text) {
  Number number{};
  const char* const end = text.data() + text.size();
  const auto [stop, problem] = std::from_chars(text.data(), end, number);
  if (problem != std::errc() || stop != end) return std::nullopt;
  return number;
}

template <class Number>
QVValue numberOf(std::string_view entry, std::string_view text, const char* reason) {
  const auto number = parseNumber<Number>(text);
  if (!number) throw wrong(entry, reason);
  return *number;
}

QVValue booleanOf(std::string_view entry, std::string_view text) {
  if (text == "true" || text == "1" || text == "yes") return true;
  if (text == "false" || text == "0" || text == "no") return false;
  throw wrong(entry, "a boolean is true or false");
}

QVValue jsonOf(std::string_view entry, std::string_view text) {
  QVJSONFailure failure;
  auto value = QVJSONFile::parse(text, failure);
  if (!value) throw wrong(entry, failure.description());
  return *std::move(value);
}

QVValue valueOfKind(std::string_view entry, std::string_view kind, std::string_view text) {
  if (kind == "int") return numberOf<int64_t>(entry, text, "no integer of 64 bits");
  if (kind == "uint") return numberOf<uint64_t>(entry, text, "no unsigned integer of 64 bits");
  if (kind == "double") return numberOf<double>(entry, text, "no double");
  if (kind == "bool") return booleanOf(entry, text);
  if (kind == "string") return text;
  if (kind == "json") return jsonOf(entry, text);
  throw wrong(entry, QVText("no kind is called \"", kind,
                            "\"; there are int, uint, double, bool, string and json"));
}

QVValue valueThatLooksSo(std::string_view text) {
  if (text == "true") return true;
  if (text == "false") return false;
  if (const auto whole = parseNumber<int64_t>(text)) return *whole;
  if (const auto natural = parseNumber<uint64_t>(text)) return *natural;
  // "nan" and "inf" are words.
  const bool isNumber = text.find_first_not_of("+-.0123456789eE") == std::string_view::npos;
  const auto real = parseNumber<double>(text);
  return isNumber && real ? QVValue(*real) : QVValue(text);
}

// Puts values into a payload, and knows where it is: "device.list[2]".
class Writer {
 public:
  Writer(QVPayloadOf use, QVClientPayload& payload) : use_(use), payload_(payload) {}

  void put(std::string_view key, const QVValue& value) {
    const std::size_t before = place_.size();
    place_.append(before == 0 ? "" : ".").append(key);
    put(&key, value);
    place_.resize(before);
  }

 private:
  void putItems(const QVArray& items) {
    const std::size_t before = place_.size();
    for (std::size_t i = 0; i < items.size(); ++i) {
      place_.append(QVText("[", i, "]"));
      put(nullptr, items[i]);
      place_.resize(before);
    }
  }

  template <class Scalar>
  void putScalar(const std::string_view* key, Scalar value) {
    if (key != nullptr) {
      payload_.set(*key, value);
    } else {
      payload_.add(value);
    }
  }

  // As deep as the JSON text was read, which is bounded.
  void put(const std::string_view* key, const QVValue& value) {
    switch (value.kind()) {
      case QVValue::Kind::boolean:
        return putScalar(key, value.boolean());
      case QVValue::Kind::integer:
        return putScalar(key, value.integer());
      case QVValue::Kind::unsignedInteger:
        return putScalar(key, value.unsignedInteger());
      case QVValue::Kind::real:
        return putScalar(key, value.real());
      case QVValue::Kind::string:
        return putScalar(key, value.string());
      case QVValue::Kind::array:
        key != nullptr ? payload_.beginArray(*key) : payload_.beginArray();
        putItems(value.array());
        payload_.endArray();
        return;
      case QVValue::Kind::dictionary:
        key != nullptr ? payload_.beginDictionary(*key) : payload_.beginDictionary();
        for (const auto& [name, item] : value.dictionary()) put(name, item);
        payload_.endDictionary();
        return;
      case QVValue::Kind::absent:
        throw wrong(place_, use_ == QVPayloadOf::message ? "there is no null in messages"
                                                         : "there is no null in configurations");
    }
  }

  const QVPayloadOf use_;
  QVClientPayload& payload_;
  std::string place_;
};

std::string readStandardInput() {
  std::string text;
  std::array<char, 65536> part;
  while (true) {
    const ssize_t count = ::read(STDIN_FILENO, part.data(), part.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) throw QVToolFailure::ofSystem("standard input", errno);
    if (count == 0) return text;
    text.append(part.data(), static_cast<std::size_t>(count));
    if (text.size() > kMaximumBytes) {
      throw wrong("standard input", QVText("larger than ", kMaximumBytes, " bytes"));
    }
  }
}

std::string textOf(const std::string& json) {
  if (json == "-") return readStandardInput();
  if (!json.starts_with('@')) return json;
  const std::string path = json.substr(1);
  const QVRegularFile file(path, QVRegularFile::Links::follow);
  std::string text;
  const int error = file.error() != 0 ? file.error() : file.read(kMaximumBytes, text);
  if (error != 0) throw wrong(path, QVRegularFile::reason(error, kMaximumBytes));
  return text;
}

// What the library says, which calls everything a payload.
std::string reasonOf(const QVClientError& error, const std::string& name) {
  constexpr std::string_view kPayload = "the payload";
  std::string text = error.text();
  const std::size_t at = text.find(kPayload);
  return at == std::string::npos ? text : text.replace(at, kPayload.size(), name);
}

}  // namespace

QVTypedValue QVTypedValue::parse(std::string_view entry) {
  const std::size_t end = entry.find('=');
  if (end == std::string_view::npos) throw wrong(entry, "an entry is KEY=VALUE or KEY:KIND=VALUE");
  std::string_view key = entry.substr(0, end);
  const std::string_view text = entry.substr(end + 1);
  const std::size_t colon = key.rfind(':');
  if (colon == 0 || key.empty()) throw wrong(entry, "the key is missing");
  if (colon == std::string_view::npos) return {std::string(key), valueThatLooksSo(text)};
  return {std::string(key.substr(0, colon)), valueOfKind(entry, key.substr(colon + 1), text)};
}

QVClientPayload QVMakePayload(QVPayloadOf use, const std::string& json,
                              const std::vector<std::string>& entries) {
  const std::string name = use == QVPayloadOf::message ? "the payload" : "the configuration";
  QVClientPayload payload;
  Writer writer(use, payload);
  if (!json.empty()) {
    const QVValue value = jsonOf(name, textOf(json));
    if (value.kind() != QVValue::Kind::dictionary) throw wrong(name, "no JSON object");
    for (const auto& [key, item] : value.dictionary()) writer.put(key, item);
  }
  for (const std::string& entry : entries) {
    const QVTypedValue typed = QVTypedValue::parse(entry);
    writer.put(typed.key, typed.value);
    if (!payload.ok()) throw wrong(entry, reasonOf(payload.error(), name));
  }
  if (!payload.ok()) throw QVToolFailure(QVToolStatus::wrongUsage, reasonOf(payload.error(), name));
  return payload;
}
