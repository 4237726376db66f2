#include "platform/linux/bus/QVBusNames.h"

#include "platform/linux/bus/QVBusProtocol.h"

#include <array>
#include <cstdint>

namespace {

enum Class : uint8_t { other = 0, letter = 1, digit = 2, hyphen = 4 };

constexpr std::array<uint8_t, 256> makeClasses() {
  std::array<uint8_t, 256> classes{};
  for (unsigned c = 'a'; c <= 'z'; ++c) classes[c] = letter;
  for (unsigned c = 'A'; c <= 'Z'; ++c) classes[c] = letter;
  for (unsigned c = '0'; c <= '9'; ++c) classes[c] = digit;
  classes['_'] = letter;
  classes['-'] = hyphen;
  return classes;
}

constexpr auto kClasses = makeClasses();

uint8_t classOf(char c) noexcept {
  return kClasses[static_cast<unsigned char>(c)];
}

// Elements between single separators; none empty. `first` and `further` are the classes allowed at
// an element's beginning and after it. Answers the number of elements, 0 where a rule is broken.
unsigned countElements(std::string_view text, char separator, unsigned first,
                       unsigned further) noexcept {
  unsigned elements = 0;
  bool atBeginning = true;
  for (const char c : text) {
    if (atBeginning) {
      if ((classOf(c) & first) == 0) return 0;
      atBeginning = false;
      ++elements;
    } else if (c == separator) {
      atBeginning = true;
    } else if ((classOf(c) & further) == 0) {
      return 0;
    }
  }
  return atBeginning ? 0 : elements;
}

}  // namespace

bool QVBusIsValidObjectPath(std::string_view path) noexcept {
  if (path.empty() || path.front() != '/') return false;
  if (path.size() == 1) return true;
  return countElements(path.substr(1), '/', letter | digit, letter | digit) != 0;
}

bool QVBusIsValidInterfaceName(std::string_view name) noexcept {
  return name.size() <= kBusMaximumNameLength &&
         countElements(name, '.', letter, letter | digit) >= 2;
}

bool QVBusIsValidMemberName(std::string_view name) noexcept {
  // There is no '\0' in a member's name, so the separator never matches.
  return name.size() <= kBusMaximumNameLength &&
         countElements(name, '\0', letter, letter | digit) == 1;
}

bool QVBusIsValidBusName(std::string_view name) noexcept {
  if (name.empty() || name.size() > kBusMaximumNameLength) return false;
  if (name.front() == ':') {
    return countElements(name.substr(1), '.', letter | digit | hyphen, letter | digit | hyphen) >=
           2;
  }
  return countElements(name, '.', letter | hyphen, letter | digit | hyphen) >= 2;
}
