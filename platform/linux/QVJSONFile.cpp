#include "platform/linux/QVJSONFile.h"

#include "platform/QVText.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <system_error>
#include <utility>
#include <vector>

#include <fcntl.h>
#include <rapidjson/error/en.h>
#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

// Bytes read at a time.
constexpr std::size_t kReadBytes = std::size_t{16} * 1024;

// Builds values from the reader's events. Answering false ends the parse.
class Builder {
 public:
  bool Null() { return add({}); }
  bool Bool(bool value) { return add(value); }
  bool Int(int value) { return add(value); }
  bool Uint(unsigned value) { return add(value); }
  bool Int64(int64_t value) { return add(value); }
  bool Uint64(uint64_t value) { return add(value); }
  bool Double(double value) { return add(value); }
  bool RawNumber(const char*, rapidjson::SizeType, bool) { return false; }
  bool String(const char* text, rapidjson::SizeType length, bool) {
    return add(std::string_view(text, length));
  }
  bool Key(const char* text, rapidjson::SizeType length, bool) {
    open_.back().keys.emplace_back(text, length);
    return true;
  }
  bool StartObject() { return begin(); }
  bool StartArray() { return begin(); }
  bool EndObject(rapidjson::SizeType) {
    const Container container = end();
    std::vector<QVDictionaryEntry> entries;
    entries.reserve(container.keys.size());
    for (std::size_t i = 0; i < container.keys.size(); ++i) {
      entries.push_back({container.keys[i], container.values[i]});
    }
    return add(QVDictionary::assemble(entries));
  }
  bool EndArray(rapidjson::SizeType) { return add(QVArray::assemble(end().values)); }

  bool tooDeep() const { return tooDeep_; }
  QVValue takeResult() { return std::move(result_); }

 private:
  struct Container {
    std::vector<std::string> keys;
    std::vector<QVValue> values;
  };

  bool begin() {
    tooDeep_ = open_.size() >= QVJSONFile::kMaximumDepth;
    if (!tooDeep_) open_.emplace_back();
    return !tooDeep_;
  }
  Container end() {
    Container container = std::move(open_.back());
    open_.pop_back();
    return container;
  }
  bool add(QVValue value) {
    (open_.empty() ? result_ : open_.back().values.emplace_back()) = std::move(value);
    return true;
  }

  std::vector<Container> open_;
  QVValue result_;
  bool tooDeep_ = false;
};

class File {
 public:
  // Without waiting for the writer of a pipe that somebody put in the file's place.
  explicit File(const std::string& path)
      : descriptor_(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK)) {}
  ~File() {
    if (descriptor_ >= 0) close(descriptor_);
  }
  File(const File&) = delete;
  File& operator=(const File&) = delete;
  int descriptor() const { return descriptor_; }

 private:
  const int descriptor_;
};

std::optional<std::string> contents(const std::string& path, QVJSONFailure& failure) {
  const File file(path);
  struct stat status {};
  if (file.descriptor() < 0 || fstat(file.descriptor(), &status) != 0) {
    failure = {.reason = std::generic_category().message(errno),
               .missing = errno == ENOENT || errno == ENOTDIR};
    return std::nullopt;
  }
  if (!S_ISREG(status.st_mode)) {
    failure = {.reason = "not a regular file"};
    return std::nullopt;
  }
  std::string text;
  std::size_t length = 0;
  while (length <= QVJSONFile::kMaximumBytes) {
    text.resize(length + kReadBytes);
    const ssize_t count = ::read(file.descriptor(), text.data() + length, text.size() - length);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) {
      failure = {.reason = std::generic_category().message(errno)};
      return std::nullopt;
    }
    if (count == 0) break;
    length += static_cast<std::size_t>(count);
  }
  if (length > QVJSONFile::kMaximumBytes) {
    failure = {.reason = QVText("larger than ", QVJSONFile::kMaximumBytes, " bytes")};
    return std::nullopt;
  }
  text.resize(length);
  return text;
}

}  // namespace

std::string QVJSONFailure::description() const {
  return line == 0 ? reason : QVText("line ", line, ", column ", column, ": ", reason);
}

std::optional<QVValue> QVJSONFile::parse(std::string_view text, QVJSONFailure& failure) {
  constexpr unsigned kFlags = rapidjson::kParseIterativeFlag | rapidjson::kParseFullPrecisionFlag |
                              rapidjson::kParseValidateEncodingFlag;
  rapidjson::MemoryStream stream(text.data(), text.size());
  rapidjson::Reader reader;
  Builder builder;
  rapidjson::ParseResult result = reader.Parse<kFlags>(stream, builder);
  // The reader takes a NUL for the text's end.
  if (!result.IsError() && stream.Tell() != text.size()) {
    result.Set(rapidjson::kParseErrorDocumentRootNotSingular, stream.Tell());
  }
  if (!result.IsError()) return builder.takeResult();
  const std::string_view before = text.substr(0, std::min(result.Offset(), text.size()));
  const std::size_t lineStart = before.rfind('\n') + 1;  // 0 where there is none
  failure = {.reason = builder.tooDeep() ? QVText("nested deeper than ", kMaximumDepth)
                                         : rapidjson::GetParseError_En(result.Code()),
             .line = static_cast<std::size_t>(std::ranges::count(before, '\n')) + 1,
             .column = before.size() - lineStart + 1};
  return std::nullopt;
}

std::optional<QVValue> QVJSONFile::read(const std::string& path, QVJSONFailure& failure) {
  const std::optional<std::string> text = contents(path, failure);
  return text ? parse(*text, failure) : std::nullopt;
}

std::optional<QVDictionary> QVJSONFile::readDictionary(const std::string& path,
                                                       QVJSONFailure& failure) {
  const std::optional<QVValue> value = read(path, failure);
  if (!value) return std::nullopt;
  if (value->kind() != QVValue::Kind::dictionary) {
    failure = {.reason = "not an object", .line = 1, .column = 1};
    return std::nullopt;
  }
  return value->dictionary();
}
