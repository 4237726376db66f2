#include "platform/fake/QVFakeJSONOutput.h"

#include "platform/QVText.h"

#include <cmath>
#include <cstddef>
#include <cstdint>
#include <string>
#include <utility>

namespace {

constexpr std::string_view kReplacement = "\xEF\xBF\xBD";

// Bytes of the character that `text` begins with, 0 where it begins with none. `piece` receives how
// many bytes could have been the beginning of one.
std::size_t characterAt(std::string_view text, std::size_t& piece) {
  const auto lead = static_cast<uint8_t>(text[0]);
  piece = 1;
  if (lead < 0x80) return 1;
  std::size_t length = 0;
  if (lead >> 5 == 0b110) length = 2;
  if (lead >> 4 == 0b1110) length = 3;
  if (lead >> 3 == 0b11110) length = 4;
  if (length == 0) return 0;
  // The least and the greatest number that the bytes so far allow.
  uint32_t least = lead & (0xFFu >> (length + 1));
  for (std::size_t i = 1; i < length; ++i) {
    if (i >= text.size() || (static_cast<uint8_t>(text[i]) & 0xC0) != 0x80) {
      piece = i;
      return 0;
    }
    least = least << 6 | (static_cast<uint8_t>(text[i]) & 0x3F);
    const auto missing = static_cast<unsigned>(6 * (length - 1 - i));
    const uint32_t low = least << missing;
    const uint32_t high = low | ((1u << missing) - 1);
    constexpr uint32_t kSmallest[] = {0, 0, 0x80, 0x800, 0x10000};
    const bool surrogates = low >= 0xD800 && high <= 0xDFFF;
    if (high < kSmallest[length] || low > 0x10FFFF || surrogates) {
      piece = i;
      return 0;
    }
  }
  return length;
}

void appendString(std::string& out, std::string_view text) {
  std::string valid;
  while (!text.empty()) {
    std::size_t piece = 0;
    const std::size_t length = characterAt(text, piece);
    valid += length == 0 ? kReplacement : text.substr(0, length);
    text.remove_prefix(length == 0 ? piece : length);
  }
  QVAppendJSONString(out, valid);
}

class Writer {
 public:
  // False where the value has no text; reason() says which then.
  bool append(const QVValue& value, std::size_t depth) {
    switch (value.kind()) {
      case QVValue::Kind::absent:
        text_ += "null";
        return true;
      case QVValue::Kind::boolean:
        text_ += value.boolean() ? "true" : "false";
        return true;
      case QVValue::Kind::real:
        return append(value.real());
      case QVValue::Kind::string:
        appendString(text_, value.string());
        return true;
      case QVValue::Kind::array: {
        const QVArray array = value.array();
        return append('[', ']', std::span(array.begin(), array.end()), depth,
                      [this, depth](const QVValue& item) { return append(item, depth + 1); });
      }
      case QVValue::Kind::dictionary:
        return appendMembers(value.dictionary(), depth);
      default:
        QVAppendText(text_, value);
        return true;
    }
  }

  bool appendMembers(std::span<const QVDictionaryEntry> members, std::size_t depth) {
    return append('{', '}', members, depth, [this, depth](const QVDictionaryEntry& member) {
      appendKey(member.key);
      if (append(member.value, depth + 1)) return true;
      if (reason_.front() != '"') reason_ = QVText('"', member.key, "\" is ", reason_);
      return false;
    });
  }

  void appendKey(std::string_view key) {
    appendString(text_, key);
    text_ += ": ";
  }

  void appendLine(std::size_t depth) { text_.append(1, '\n').append(2 * depth, ' '); }

  std::string& text() { return text_; }
  const std::string& reason() const { return reason_; }

 private:
  template <class Items, class Append>
  bool append(char open, char close, const Items& items, std::size_t depth, Append appendItem) {
    text_ += open;
    bool first = true;
    for (const auto& item : items) {
      if (!std::exchange(first, false)) text_ += ',';
      appendLine(depth + 1);
      if (!appendItem(item)) return false;
    }
    if (!first) appendLine(depth);
    text_ += close;
    return true;
  }

  bool append(double number) {
    const std::string text = QVText(number);
    if (!std::isfinite(number)) {
      reason_ = QVText(text, ", which JSON has no word for");
      return false;
    }
    text_ += text;
    if (text.find_first_of(".e") == std::string::npos) text_ += ".0";
    return true;
  }

  std::string text_;
  std::string reason_;
};

}  // namespace

class QVFakeJSONOutput::Stream final : public QVJSONArrayStream {
 public:
  Stream(Sink sink, std::shared_ptr<QVFakeMisuse> misuse)
      : sink_(std::move(sink)), misuse_(std::move(misuse)) {}

  std::optional<QVError> append(std::span<const QVDictionaryEntry> members) override {
    checkOrder(members);
    Writer writer = begin();
    return finish(writer, writer.appendMembers(members, 1), {});
  }

  std::optional<QVError> append(std::string_view name,
                                std::span<const QVDictionaryEntry> members) override {
    checkOrder(members);
    Writer writer = begin();
    writer.text() += '{';
    writer.appendLine(2);
    writer.appendKey(name);
    const bool written = writer.appendMembers(members, 2);
    writer.appendLine(1);
    writer.text() += '}';
    return finish(writer, written, QVText(name, ": "));
  }

  void end() override {
    if (failure_) misuse_->note("an array ended that failed");
    if (std::exchange(ended_, true)) misuse_->note("an array ended twice");
    sink_(elements_ == 0 ? "[]" : "\n]");
  }

 private:
  void checkOrder(std::span<const QVDictionaryEntry> members) {
    if (ended_) misuse_->note("an array appended to after its end");
    for (std::size_t i = 1; i < members.size(); ++i) {
      if (members[i - 1].key >= members[i].key) misuse_->note("members out of order");
    }
  }

  Writer begin() const {
    Writer writer;
    writer.text() += elements_ == 0 ? '[' : ',';
    writer.appendLine(1);
    return writer;
  }

  std::optional<QVError> finish(Writer& writer, bool written, std::string_view where) {
    if (failure_) return failure_;
    if (!written) {
      failure_ = {.domain = "net.quillon.json",
                  .code = 1,
                  .userInfo = {{QVError::kFailureReason, QVText(where, writer.reason())}}};
      return failure_;
    }
    ++elements_;
    sink_(writer.text());
    return std::nullopt;
  }

  Sink sink_;
  const std::shared_ptr<QVFakeMisuse> misuse_;
  std::size_t elements_ = 0;
  std::optional<QVError> failure_;
  bool ended_ = false;
};

std::unique_ptr<QVJSONArrayStream> QVFakeJSONOutput::makeArrayStream(Sink sink) {
  return std::make_unique<Stream>(std::move(sink), misuse_);
}
