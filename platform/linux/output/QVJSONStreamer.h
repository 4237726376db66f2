#pragma once

#include "platform/QVValue.h"
#include "platform/linux/output/QVJSONScalars.h"

#include <cmath>
#include <span>
#include <string_view>

// Feeds values to one of RapidJSON's writers. Shared by the sources that write JSON text; not for
// other headers.
//
// RapidJSON looks at each character of a string, and makes room for six times as many. So a writer
// has, beside its own operations, plainString(text) and number(text), which copy what needs no
// look, and openString(), piece(text) and closeString() for a string in pieces.
//
// Threads: one at a time. The writer outlives it.
template <class Writer>
class QVJSONStreamer {
 public:
  // JSON has no word for NaN and the infinities.
  enum class NonFinite {
    refuse,  // such a value is not written
    quote    // they are written as the strings "nan", "inf" and "-inf"
  };

  QVJSONStreamer(Writer& writer, NonFinite nonFinite) : writer_(writer), nonFinite_(nonFinite) {}

  // False where a value was refused; the text is not whole then.
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

  bool dictionary(std::span<const QVDictionaryEntry> entries) {
    writer_.StartObject();
    for (const QVDictionaryEntry& entry : entries) {
      if (string(entry.key) && value(entry.value)) continue;
      if (refusedKey_.data() == nullptr) refusedKey_ = entry.key;
      return false;
    }
    return writer_.EndObject();
  }

  bool string(std::string_view text) {
    if (QVIsPlainJSONText(text)) return writer_.plainString(text);
    writer_.openString();
    QVJSONStringPieces pieces(text);
    for (auto piece = pieces.next(); !piece.empty(); piece = pieces.next()) writer_.piece(piece);
    return writer_.closeString();
  }

  // What was refused, and the innermost key under which it lies. Valid as long as the value.
  double refusedNumber() const { return refusedNumber_; }
  std::string_view refusedKey() const { return refusedKey_; }

 private:
  bool array(const QVArray& array) {
    writer_.StartArray();
    for (const QVValue& item : array) {
      if (!value(item)) return false;
    }
    return writer_.EndArray();
  }

  bool real(double number) {
    if (std::isfinite(number)) {
      QVJSONDigits digits;
      return writer_.number(QVWriteJSONReal(number, digits));
    }
    if (nonFinite_ == NonFinite::quote) {
      return string(std::isnan(number) ? "nan" : number < 0 ? "-inf" : "inf");
    }
    refusedNumber_ = number;
    return false;
  }

  Writer& writer_;
  const NonFinite nonFinite_;
  double refusedNumber_ = 0;
  std::string_view refusedKey_;
};
