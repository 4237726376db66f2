#include "platform/linux/bus/QVBusSignature.h"

bool QVBusSignature::isBasic(char type) noexcept {
  switch (type) {
    case 'y':
    case 'b':
    case 'n':
    case 'q':
    case 'i':
    case 'u':
    case 'x':
    case 't':
    case 'd':
    case 's':
    case 'o':
    case 'g':
    case 'h':
      return true;
    default:
      return false;
  }
}

std::size_t QVBusSignature::alignmentOf(char type) noexcept {
  switch (type) {
    case 'y':
    case 'g':
    case 'v':
      return 1;
    case 'n':
    case 'q':
      return 2;
    case 'b':
    case 'i':
    case 'u':
    case 'h':
    case 's':
    case 'o':
    case 'a':
      return 4;
    case 'x':
    case 't':
    case 'd':
    case '(':
    case '{':
      return 8;
    default:
      return 0;
  }
}

std::size_t QVBusSignature::fixedSizeOf(char type) noexcept {
  switch (type) {
    case 'y':
      return 1;
    case 'n':
    case 'q':
      return 2;
    case 'i':
    case 'u':
      return 4;
    case 'x':
    case 't':
    case 'd':
      return 8;
    default:
      return 0;
  }
}

bool QVBusSignature::parse(std::string_view text) noexcept {
  if (text.size() > kBusMaximumSignatureLength) return false;
  text_ = text;
  for (std::size_t index = 0; index < text.size();) {
    index = parseType(index, 0, 0);
    if (index == 0) return false;
  }
  return true;
}

// The parsers answer the index behind the type at `index`, or 0 where there is none.

std::size_t QVBusSignature::parseType(std::size_t index, unsigned arrays,
                                      unsigned structs) noexcept {
  if (index >= text_.size()) return 0;
  const char type = text_[index];
  std::size_t end = 0;
  if (isBasic(type) || type == 'v') {
    end = index + 1;
  } else if (type == 'a' && arrays < kBusMaximumArrayDepth) {
    end = parseArray(index, arrays + 1, structs);
  } else if (type == '(' && structs < kBusMaximumStructDepth) {
    end = parseStruct(index, arrays, structs + 1);
  }
  if (end != 0) ends_[index] = static_cast<uint8_t>(end);
  return end;
}

std::size_t QVBusSignature::parseArray(std::size_t index, unsigned arrays,
                                       unsigned structs) noexcept {
  const std::size_t element = index + 1;
  if (element >= text_.size() || text_[element] != '{') return parseType(element, arrays, structs);
  // A dictionary: its entries are a basic key and one complete type, and occur nowhere else.
  const std::size_t key = element + 1;
  if (key >= text_.size() || !isBasic(text_[key])) return 0;
  ends_[key] = static_cast<uint8_t>(key + 1);
  const std::size_t end = parseType(key + 1, arrays, structs);
  if (end == 0 || end >= text_.size() || text_[end] != '}') return 0;
  ends_[element] = static_cast<uint8_t>(end + 1);
  return end + 1;
}

std::size_t QVBusSignature::parseStruct(std::size_t index, unsigned arrays,
                                        unsigned structs) noexcept {
  std::size_t member = index + 1;
  do {
    member = parseType(member, arrays, structs);
    if (member == 0 || member >= text_.size()) return 0;
  } while (text_[member] != ')');
  return member + 1;
}
