#include "QVServices/Statistics/Service/QVReportingPayloadCoding.h"

#include <bit>
#include <cstdint>
#include <cstring>

namespace {

enum Tag : uint8_t {
  kAbsent,
  kFalse,
  kTrue,
  kInteger,
  kUnsignedInteger,
  kSingle,
  kDouble,
  kString,
  kKnownText,
  kArray,
  kDictionary,
  // Tags from here on are integers from 0 up.
  kSmallInteger = 16
};
constexpr int64_t kSmallIntegers = 256 - kSmallInteger;

void appendTag(std::string& out, int64_t tag) {
  out.push_back(static_cast<char>(tag));
}

template <class Fixed>
void appendFixed(std::string& out, Fixed value) {
  char bytes[sizeof value];
  std::memcpy(bytes, &value, sizeof value);
  out.append(bytes, sizeof value);
}

void encodeReal(std::string& out, double value) {
  const auto single = static_cast<float>(value);
  // Compared as bits: a NaN's payload and the sign of zero survive.
  if (std::bit_cast<uint64_t>(static_cast<double>(single)) == std::bit_cast<uint64_t>(value)) {
    appendTag(out, kSingle);
    appendFixed(out, single);
  } else {
    appendTag(out, kDouble);
    appendFixed(out, value);
  }
}

void encodeInteger(std::string& out, int64_t value) {
  if (value >= 0 && value < kSmallIntegers) {
    appendTag(out, kSmallInteger + value);
  } else {
    appendTag(out, kInteger);
    const auto bits = static_cast<uint64_t>(value);
    QVReportingEncodeNumber(out, (bits << 1) ^ (value < 0 ? ~uint64_t{0} : 0));
  }
}

void encodeString(std::string& out, std::string_view text, QVReportingKnownTexts& known) {
  if (const std::string* const copy = known.keep(text)) {
    appendTag(out, kKnownText);
    appendFixed(out, reinterpret_cast<std::uintptr_t>(copy));
  } else {
    appendTag(out, kString);
    QVReportingEncodeText(out, text);
  }
}

}  // namespace

void QVReportingEncodeNumber(std::string& out, uint64_t number) {
  while (number >= 0x80) {
    out.push_back(static_cast<char>(number | 0x80));
    number >>= 7;
  }
  out.push_back(static_cast<char>(number));
}

void QVReportingEncodeText(std::string& out, std::string_view text) {
  QVReportingEncodeNumber(out, text.size());
  out.append(text);
}

void QVReportingEncodeValue(std::string& out, const QVValue& value, QVReportingKnownTexts& known) {
  switch (value.kind()) {
    case QVValue::Kind::absent:
      appendTag(out, kAbsent);
      break;
    case QVValue::Kind::boolean:
      appendTag(out, value.boolean() ? kTrue : kFalse);
      break;
    case QVValue::Kind::integer:
      encodeInteger(out, value.integer());
      break;
    case QVValue::Kind::unsignedInteger:
      appendTag(out, kUnsignedInteger);
      appendFixed(out, value.unsignedInteger());
      break;
    case QVValue::Kind::real:
      encodeReal(out, value.real());
      break;
    case QVValue::Kind::string:
      encodeString(out, value.string(), known);
      break;
    case QVValue::Kind::array: {
      const QVArray array = value.array();
      appendTag(out, kArray);
      QVReportingEncodeNumber(out, array.size());
      for (const QVValue& item : array) QVReportingEncodeValue(out, item, known);
      break;
    }
    case QVValue::Kind::dictionary: {
      const QVDictionary dictionary = value.dictionary();
      appendTag(out, kDictionary);
      QVReportingEncodeNumber(out, dictionary.size());
      for (const auto& entry : dictionary) {
        QVReportingEncodeText(out, entry.key);
        QVReportingEncodeValue(out, entry.value, known);
      }
      break;
    }
  }
}

uint64_t QVReportingPayloadDecoder::number() {
  uint64_t number = 0;
  for (unsigned shift = 0;; shift += 7) {
    const uint8_t byte = *next_++;
    number |= static_cast<uint64_t>(byte & 0x7F) << shift;
    if (byte < 0x80) return number;
  }
}

std::string_view QVReportingPayloadDecoder::text() {
  const std::size_t length = number();
  const auto* characters = reinterpret_cast<const char*>(next_);
  next_ += length;
  return {characters, length};
}

template <class Fixed>
Fixed QVReportingPayloadDecoder::fixed() {
  Fixed value;
  std::memcpy(&value, next_, sizeof value);
  next_ += sizeof value;
  return value;
}

QVValue QVReportingPayloadDecoder::value() {
  const uint8_t tag = *next_++;
  if (tag >= kSmallInteger) return QVValue(int64_t{tag} - kSmallInteger);
  switch (tag) {
    case kFalse:
      return QVValue(false);
    case kTrue:
      return QVValue(true);
    case kInteger: {
      const uint64_t bits = number();
      return QVValue(static_cast<int64_t>((bits >> 1) ^ (~(bits & 1) + 1)));
    }
    case kUnsignedInteger:
      return QVValue(fixed<uint64_t>());
    case kSingle:
      return QVValue(static_cast<double>(fixed<float>()));
    case kDouble:
      return QVValue(fixed<double>());
    case kString:
      return QVValue::borrowing(text());
    case kKnownText:
      return QVValue::borrowing(*reinterpret_cast<const std::string*>(fixed<std::uintptr_t>()));
    case kArray: {
      std::vector<QVValue> items(number());
      for (QVValue& item : items) item = value();
      return QVValue(QVArray::assemble(items));
    }
    case kDictionary: {
      std::vector<QVDictionaryEntry> entries(number());
      for (auto& entry : entries) {
        entry.key = text();
        entry.value = value();
      }
      return QVValue(QVDictionary::assemble(entries));
    }
    default:
      return {};
  }
}
