#include "client/QVReportingPreference.h"

#include "platform/linux/QVDescriptor.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <cstddef>
#include <system_error>

#include <fcntl.h>
#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

constexpr std::string_view kKey = "disable_reporting";

// Bytes, and arrays and objects within one another, as the service limits them.
constexpr std::size_t kMaximumBytes = std::size_t{4} << 20;
constexpr std::size_t kMaximumDepth = 64;

bool equalsIgnoringCase(std::string_view text, std::string_view lowerCase) {
  return std::equal(text.begin(), text.end(), lowerCase.begin(), lowerCase.end(),
                    [](char a, char b) { return (a >= 'A' && a <= 'Z' ? a - 'A' + 'a' : a) == b; });
}

// Looks for the key in the outermost object. Answering false ends the parse.
class Handler {
 public:
  bool Null() { return value(false); }
  bool Bool(bool isTrue) { return value(isTrue); }
  // Numbers come as their text (kParseNumbersAsStringsFlag), so these are never called.
  bool Int(int) { return false; }
  bool Uint(unsigned) { return false; }
  bool Int64(int64_t) { return false; }
  bool Uint64(uint64_t) { return false; }
  bool Double(double) { return false; }
  bool RawNumber(const char* text, rapidjson::SizeType length, bool) {
    double number = 0;
    const bool tooLargeOrSmall =
        std::from_chars(text, text + length, number).ec == std::errc::result_out_of_range;
    if (!tooLargeOrSmall) return value(number != 0);
    // Too small a number is 0, and too large a one breaks the text. Digits before the point or a
    // positive exponent make the difference, whatever the program's locale.
    return isTooSmall({text, length}) && value(false);
  }
  bool String(const char* text, rapidjson::SizeType length, bool) {
    constexpr std::array<std::string_view, 3> kTrue{"true", "yes", "1"};
    const std::string_view word(text, length);
    return isPaired(word) && value(std::ranges::any_of(kTrue, [word](std::string_view one) {
             return equalsIgnoringCase(word, one);
           }));
  }
  bool Key(const char* text, rapidjson::SizeType length, bool) {
    isKey_ = depth_ == 1 && std::string_view(text, length) == kKey;
    return isPaired({text, length});
  }
  bool StartObject() {
    isObject_ = isObject_ || depth_ == 0;
    return begin();
  }
  bool StartArray() { return begin(); }
  bool EndObject(rapidjson::SizeType) { return end(); }
  bool EndArray(rapidjson::SizeType) { return end(); }

  bool isOff() const { return isObject_ && isOff_; }

 private:
  // Of equal keys the later wins.
  bool value(bool off) {
    if (isKey_ && depth_ == 1) isOff_ = off;
    return true;
  }
  bool begin() {
    value(false);
    return ++depth_ <= kMaximumDepth;
  }
  bool end() {
    --depth_;
    return true;
  }
  // The reader makes a character of a second surrogate's escape that has no first one before it.
  static bool isPaired(std::string_view text) {
    for (std::size_t at = text.find('\xED'); at != std::string_view::npos;
         at = text.find('\xED', at + 1)) {
      if (static_cast<unsigned char>(text[at + 1]) >= 0xA0) return false;
    }
    return true;
  }
  // A number that no double can hold is too small where its first digit that counts lies far behind
  // the point.
  static bool isTooSmall(std::string_view number) {
    const std::size_t mark = number.find_first_of("eE");
    if (mark != std::string_view::npos) return number[mark + 1] == '-';
    return number.starts_with("0.") || number.starts_with("-0.");
  }

  std::size_t depth_ = 0;
  bool isObject_ = false;
  bool isKey_ = false;
  bool isOff_ = false;
};

// Nothing where it is no regular file, too large, or cannot be read.
std::string contentsOf(const std::string& path) {
  // Not waiting for the other end of a pipe.
  const QVDescriptor file(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
  struct stat status {};
  if (!file.isOpen() || fstat(file.get(), &status) != 0 || !S_ISREG(status.st_mode)) return {};
  std::string text;
  constexpr std::size_t kStepBytes = 4096;
  for (;;) {
    const std::size_t length = text.size();
    text.resize(length + kStepBytes);
    const ssize_t count = read(file.get(), text.data() + length, kStepBytes);
    text.resize(length + static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
    if (count < 0 && errno == EINTR) continue;
    if (count < 0 || text.size() > kMaximumBytes) return {};
    if (count == 0) return text;
  }
}

}  // namespace

bool QVReportingIsSwitchedOff(std::string_view text) {
  constexpr unsigned kFlags = rapidjson::kParseIterativeFlag |
                              rapidjson::kParseNumbersAsStringsFlag |
                              rapidjson::kParseValidateEncodingFlag;
  rapidjson::MemoryStream stream(text.data(), text.size());
  rapidjson::Reader reader;
  Handler handler;
  const rapidjson::ParseResult result = reader.Parse<kFlags>(stream, handler);
  // The reader takes a NUL for the text's end.
  return !result.IsError() && stream.Tell() == text.size() && handler.isOff();
}

bool QVReportingIsSwitchedOffByFile(const std::string& path) {
  return QVReportingIsSwitchedOff(contentsOf(path));
}
