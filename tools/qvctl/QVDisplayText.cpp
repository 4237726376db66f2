#include "tools/qvctl/QVDisplayText.h"

#include <cstdint>
#include <cstdio>
#include <cwchar>

#include <locale.h>

namespace {

// Bytes of a character in UTF-8, at the most.
constexpr std::size_t kLongestCharacter = 4;

struct Character {
  char32_t code = 0;
  std::size_t bytes = 1;
  bool isValid = false;
};

bool isContinuation(char byte) {
  return (static_cast<unsigned char>(byte) & 0xC0U) == 0x80U;
}

// Of a character that begins so, if it is one.
std::size_t bytesOf(unsigned char lead) {
  return lead >= 0xF0 ? 4 : lead >= 0xE0 ? 3 : lead >= 0xC0 ? 2 : 1;
}

// The first character of a text that is not empty; a single byte where that is no UTF-8.
Character firstCharacter(std::string_view text) {
  const auto lead = static_cast<unsigned char>(text[0]);
  if (lead < 0x80) return {lead, 1, true};
  const std::size_t bytes = bytesOf(lead);
  if (lead < 0xC2 || lead > 0xF4 || text.size() < bytes) return {lead, 1, false};
  char32_t code = lead & (0x7FU >> bytes);
  for (std::size_t i = 1; i < bytes; ++i) {
    if (!isContinuation(text[i])) return {lead, 1, false};
    code = code << 6U | (static_cast<unsigned char>(text[i]) & 0x3FU);
  }
  constexpr char32_t kSmallest[] = {0, 0, 0x80, 0x800, 0x10000};
  const bool isSurrogate = code >= 0xD800 && code <= 0xDFFF;
  if (code < kSmallest[bytes] || code > 0x10FFFF || isSurrogate) return {lead, 1, false};
  return {code, bytes, true};
}

// Above ASCII: what has a terminal or a reader see something else than what is there.
bool isTreacherous(char32_t code) {
  return (code >= 0x80 && code <= 0x9F) || code == 0xAD || code == 0x061C || code == 0x180E ||
         code == 0x3164 || (code >= 0xE0000 && code <= 0xE007F) ||
         (code >= 0x200B && code <= 0x200F) || (code >= 0x2028 && code <= 0x202E) ||
         (code >= 0x2060 && code <= 0x206F) || code == 0xFEFF;
}

void appendFormatted(std::string& out, const char* format, unsigned number) {
  char text[16];
  std::snprintf(text, sizeof text, format, number);
  out.append(text);
}

void appendEscaped(std::string& out, const Character& character) {
  switch (character.code) {
    case '\n':
      out.append("\\n");
      break;
    case '\t':
      out.append("\\t");
      break;
    case '\r':
      out.append("\\r");
      break;
    default:
      // A byte as "\xFF", a character as "\u009B".
      const bool isByte = !character.isValid || character.code < 0x80;
      appendFormatted(out, isByte ? "\\x%02X" : "\\u%04X", character.code);
  }
}

// Columns of one character. The environment's locale may know ASCII alone; this one is always
// there.
int columnsOf(char32_t code) {
  static const locale_t kLocale = ::newlocale(LC_CTYPE_MASK, "C.UTF-8", nullptr);
  if (code < 0x80 || kLocale == nullptr) return 1;
  const locale_t previous = ::uselocale(kLocale);
  const int columns = ::wcwidth(static_cast<wchar_t>(code));
  ::uselocale(previous);
  return columns < 0 ? 1 : columns;
}

}  // namespace

std::string QVDisplayText(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  while (!text.empty()) {
    const Character character = firstCharacter(text);
    const bool isControl = character.code < 0x20 || character.code == 0x7F;
    if (!character.isValid || isControl || isTreacherous(character.code)) {
      appendEscaped(out, character);
    } else {
      out.append(text.substr(0, character.bytes));
    }
    text.remove_prefix(character.bytes);
  }
  return out;
}

std::string QVDisplayJSON(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  while (!text.empty()) {
    const Character character = firstCharacter(text);
    if (character.isValid && (character.code == 0x7F || isTreacherous(character.code))) {
      // Beyond 16 bits JSON has two halves.
      const unsigned above = character.code - 0x10000;
      if (character.code >= 0x10000) appendFormatted(out, "\\u%04x", 0xD800 + (above >> 10U));
      const bool isWhole = character.code < 0x10000;
      appendFormatted(out, "\\u%04x", isWhole ? character.code : 0xDC00 + (above & 0x3FFU));
    } else {
      out.append(text.substr(0, character.bytes));
    }
    text.remove_prefix(character.bytes);
  }
  return out;
}

std::size_t QVWholeCharacters(std::string_view text) {
  std::size_t at = text.size();
  for (std::size_t missing = 1; missing < kLongestCharacter && at > 0; ++missing) {
    --at;
    if (isContinuation(text[at])) continue;
    return bytesOf(static_cast<unsigned char>(text[at])) > missing ? at : text.size();
  }
  return text.size();
}

std::size_t QVDisplayWidth(std::string_view text) {
  std::size_t columns = 0;
  while (!text.empty()) {
    const Character character = firstCharacter(text);
    columns += character.isValid ? static_cast<std::size_t>(columnsOf(character.code)) : 1;
    text.remove_prefix(character.bytes);
  }
  return columns;
}

std::string QVClippedText(std::string_view text, std::size_t columns) {
  std::size_t taken = 0;
  std::size_t fits = 0;  // bytes that leave a column for the sign that something is missing
  std::string_view rest = text;
  while (!rest.empty()) {
    const Character character = firstCharacter(rest);
    taken += character.isValid ? static_cast<std::size_t>(columnsOf(character.code)) : 1;
    if (taken > columns) {
      std::string clipped(text.substr(0, fits));
      return columns == 0 ? clipped : clipped.append("…");
    }
    rest.remove_prefix(character.bytes);
    if (taken < columns) fits = text.size() - rest.size();
  }
  return std::string(text);
}
