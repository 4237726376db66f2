#include "platform/QVText.h"

#include <array>
#include <charconv>
#include <cmath>

namespace {

template <class Number, class... Format>
void appendNumber(std::string& out, Number value, Format... format) {
  std::array<char, 64> digits;
  const auto result = std::to_chars(digits.data(), digits.data() + digits.size(), value, format...);
  out.append(digits.data(), result.ptr);
}

// A value inside JSON: strings are quoted, absence is JSON's own word.
void appendJSONValue(std::string& out, const QVValue& value) {
  switch (value.kind()) {
    case QVValue::Kind::absent:
      out.append("null");
      break;
    case QVValue::Kind::boolean:
      out.append(value.boolean() ? "true" : "false");
      break;
    case QVValue::Kind::string:
      QVAppendJSONString(out, value.string());
      break;
    default:
      QVAppendText(out, value);
      break;
  }
}

}  // namespace

void QVAppendText(std::string& out, int64_t value) {
  appendNumber(out, value);
}

void QVAppendText(std::string& out, uint64_t value) {
  appendNumber(out, value);
}

void QVAppendText(std::string& out, double value) {
  if (std::isnan(value)) {
    out.append("nan");
  } else if (std::isinf(value)) {
    out.append(value < 0 ? "-inf" : "inf");
  } else if (value == 0 || (std::fabs(value) >= 1e-4 && std::fabs(value) < 1e17)) {
    appendNumber(out, value, std::chars_format::fixed);
  } else {
    appendNumber(out, value, std::chars_format::scientific);
  }
}

void QVAppendText(std::string& out, const QVValue& value) {
  switch (value.kind()) {
    case QVValue::Kind::absent:
      out.append("(null)");
      break;
    case QVValue::Kind::boolean:
      QVAppendText(out, value.boolean());
      break;
    case QVValue::Kind::integer:
      QVAppendText(out, value.integer());
      break;
    case QVValue::Kind::unsignedInteger:
      QVAppendText(out, value.unsignedInteger());
      break;
    case QVValue::Kind::real:
      QVAppendText(out, value.real());
      break;
    case QVValue::Kind::string:
      out.append(value.string());
      break;
    case QVValue::Kind::array:
      QVAppendText(out, value.array());
      break;
    case QVValue::Kind::dictionary:
      QVAppendText(out, value.dictionary());
      break;
  }
}

void QVAppendText(std::string& out, const QVArray& value) {
  out.push_back('[');
  for (const QVValue* item = value.begin(); item != value.end(); ++item) {
    if (item != value.begin()) out.push_back(',');
    appendJSONValue(out, *item);
  }
  out.push_back(']');
}

void QVAppendText(std::string& out, const QVDictionary& value) {
  out.push_back('{');
  for (const auto* entry = value.begin(); entry != value.end(); ++entry) {
    if (entry != value.begin()) out.push_back(',');
    QVAppendJSONString(out, entry->key);
    out.push_back(':');
    appendJSONValue(out, entry->value);
  }
  out.push_back('}');
}

void QVAppendJSONString(std::string& out, std::string_view text) {
  constexpr std::string_view kHex = "0123456789abcdef";
  out.push_back('"');
  for (const char c : text) {
    switch (c) {
      case '"':
        out.append("\\\"");
        break;
      case '\\':
        out.append("\\\\");
        break;
      case '\n':
        out.append("\\n");
        break;
      case '\r':
        out.append("\\r");
        break;
      case '\t':
        out.append("\\t");
        break;
      default:
        if (static_cast<unsigned char>(c) < 0x20) {
          out.append("\\u00");
          out.push_back(kHex[static_cast<unsigned char>(c) >> 4]);
          out.push_back(kHex[static_cast<unsigned char>(c) & 15]);
        } else {
          out.push_back(c);
        }
    }
  }
  out.push_back('"');
}
