#include "platform/linux/files/QVJSONScan.h"

#include "platform/QVText.h"

#include <algorithm>
#include <cstddef>
#include <string>
#include <utility>

#include <rapidjson/error/en.h>
#include <rapidjson/reader.h>

namespace {

// Bytes that are read at once.
constexpr std::size_t kPartBytes = std::size_t{64} << 10;

// The file, as the reader takes it: character by character, with a NUL at its end.
class Stream {
 public:
  explicit Stream(const QVRegularFile& file) : file_(file) { refill(); }

  // The reader's names.
  // NOLINTBEGIN(readability-identifier-naming)
  using Ch = char;
  // A string has a NUL behind its last character.
  Ch Peek() const { return *at_; }
  Ch Take() {
    const Ch taken = *at_;
    if (isAtEnd()) return taken;
    if (++at_ == part_.data() + part_.size()) refill();
    return taken;
  }
  std::size_t Tell() const { return before_ + static_cast<std::size_t>(at_ - part_.data()); }
  // The reader asks for these where a text is changed in its place, which this one is not.
  Ch* PutBegin() { return nullptr; }
  void Put(Ch /*character*/) {}
  void Flush() {}
  std::size_t PutEnd(Ch* /*begin*/) { return 0; }
  // NOLINTEND(readability-identifier-naming)

  bool isAtEnd() const { return part_.empty(); }
  int error() const { return error_; }

 private:
  void refill() {
    before_ += part_.size();
    error_ = file_.readPart(before_, kPartBytes, part_);
    at_ = part_.data();
  }

  const QVRegularFile& file_;
  std::string part_;
  std::size_t before_ = 0;  // bytes before the part
  const char* at_ = nullptr;
  int error_ = 0;
};

// Hands the reader's events on. Answering false ends the scan.
class Handler {
 public:
  explicit Handler(QVJSONReceiver& receiver) : receiver_(receiver) {}

  bool Null() { return isInside() && (receiver_.null(), true); }
  bool Bool(bool value) { return isInside() && (receiver_.boolean(value), true); }
  // Numbers come as their text (kParseNumbersAsStringsFlag), so these are never called.
  bool Int(int) { return false; }
  bool Uint(unsigned) { return false; }
  bool Int64(int64_t) { return false; }
  bool Uint64(uint64_t) { return false; }
  bool Double(double) { return false; }
  bool RawNumber(const char* text, rapidjson::SizeType length, bool) {
    return isInside() && (receiver_.number({text, length}), true);
  }
  bool String(const char* text, rapidjson::SizeType length, bool) {
    return isInside() && (receiver_.string({text, length}), true);
  }
  bool Key(const char* text, rapidjson::SizeType length, bool) {
    receiver_.key({text, length});
    return true;
  }
  bool StartObject() { return isInside() && begin(QVJSONReceiver::Container::dictionary); }
  bool StartArray() { return begin(QVJSONReceiver::Container::array); }
  bool EndObject(rapidjson::SizeType) { return end(QVJSONReceiver::Container::dictionary); }
  bool EndArray(rapidjson::SizeType) { return end(QVJSONReceiver::Container::array); }

  // Why it ended the scan; empty where it did not.
  const std::string& refusal() const { return refusal_; }

 private:
  bool isInside() {
    if (depth_ == 0) refusal_ = "no JSON array";
    return depth_ > 0;
  }
  bool begin(QVJSONReceiver::Container container) {
    if (depth_ == QVJSONFile::kMaximumDepth) {
      refusal_ = QVText("nested deeper than ", QVJSONFile::kMaximumDepth);
      return false;
    }
    ++depth_;
    receiver_.begin(container);
    return true;
  }
  bool end(QVJSONReceiver::Container container) {
    --depth_;
    receiver_.end(container);
    return true;
  }

  QVJSONReceiver& receiver_;
  std::size_t depth_ = 0;
  std::string refusal_;
};

// Where in the file that many bytes are before, for people.
QVJSONFailure failureAt(const QVRegularFile& file, std::size_t offset, std::string reason) {
  QVJSONFailure failure{.reason = std::move(reason), .line = 1, .column = 1};
  std::string part;
  for (std::size_t before = 0; before < offset; before += part.size()) {
    const int error = file.readPart(before, std::min(kPartBytes, offset - before), part);
    if (error != 0 || part.empty()) break;
    failure.line += static_cast<std::size_t>(std::ranges::count(part, '\n'));
    const std::size_t last = part.rfind('\n');
    failure.column = last == std::string::npos ? failure.column + part.size() : part.size() - last;
  }
  return failure;
}

}  // namespace

bool QVScanJSONArray(const QVRegularFile& file, QVJSONReceiver& receiver, QVJSONFailure& failure) {
  constexpr unsigned kFlags = rapidjson::kParseIterativeFlag |
                              rapidjson::kParseNumbersAsStringsFlag |
                              rapidjson::kParseValidateEncodingFlag;
  Stream stream(file);
  Handler handler(receiver);
  rapidjson::Reader reader;
  rapidjson::ParseResult result = reader.Parse<kFlags>(stream, handler);
  if (stream.error() != 0) {
    failure = {.reason = QVRegularFile::reason(stream.error(), 0)};
    return false;
  }
  // The reader takes a NUL for the text's end.
  if (!result.IsError() && !stream.isAtEnd()) {
    result.Set(rapidjson::kParseErrorDocumentRootNotSingular, stream.Tell());
  }
  if (!result.IsError()) return true;
  failure = failureAt(
      file, result.Offset(),
      handler.refusal().empty() ? rapidjson::GetParseError_En(result.Code()) : handler.refusal());
  return false;
}
