#include "platform/linux/log/QVLogLine.h"

#include "platform/linux/bus/QVBusText.h"

#include <algorithm>

namespace {

constexpr std::string_view kDigits = "0123456789abcdef";

void appendHexadecimal(std::string& out, std::string_view prefix, unsigned char byte) {
  out.append(prefix);
  out.push_back(kDigits[byte >> 4U]);
  out.push_back(kDigits[byte & 0xFU]);
}

bool isPlain(char character) {
  return character >= ' ' && character < '\x7F';
}

void appendControl(std::string& out, char character) {
  switch (character) {
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
      appendHexadecimal(out, "\\x", static_cast<unsigned char>(character));
  }
}

// Bytes of the character that begins `text` with a byte above ASCII; 0 where none does.
std::size_t lengthOfCharacter(std::string_view text) {
  const auto lead = static_cast<unsigned char>(text.front());
  std::size_t length = 0;
  if (lead >= 0xC2) length = 2;
  if (lead >= 0xE0) length = 3;
  if (lead >= 0xF0) length = 4;
  if (length > text.size() || !QVBusIsValidText(text.substr(0, length))) return 0;
  return length;
}

}  // namespace

void QVAppendLogText(std::string& out, std::string_view text) {
  while (!text.empty()) {
    const auto plain =
        static_cast<std::size_t>(std::ranges::find_if_not(text, isPlain) - text.begin());
    out.append(text.substr(0, plain));
    text.remove_prefix(plain);
    if (text.empty()) return;
    const char first = text.front();
    if (first >= 0) {
      appendControl(out, first);
      text.remove_prefix(1);
      continue;
    }
    const std::size_t length = lengthOfCharacter(text);
    const auto second = length == 2 ? static_cast<unsigned char>(text[1]) : 0U;
    if (length == 0) {
      appendHexadecimal(out, "\\x", static_cast<unsigned char>(first));
    } else if (first == '\xC2' && second < 0xA0U) {
      appendHexadecimal(out, "\\u00", static_cast<unsigned char>(second));
    } else {
      out.append(text.substr(0, length));
    }
    text.remove_prefix(std::max<std::size_t>(length, 1));
  }
}
