#include "platform/linux/output/QVRapidJSONOutput.h"

#include "platform/QVText.h"
#include "platform/linux/output/QVJSONStreamer.h"

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstring>
#include <utility>

#include <rapidjson/prettywriter.h>

namespace {

// What a piece of text holds, in bytes: enough that handing it on costs nothing beside writing it.
constexpr std::size_t kPieceBytes = std::size_t{64} * 1024;

constexpr unsigned kIndentation = 2;

// The stream that RapidJSON writes to.
class Pieces {
 public:
  using Ch = char;

  explicit Pieces(QVJSONOutput::Sink sink) : sink_(std::move(sink)) {}

  // NOLINTNEXTLINE(readability-identifier-naming): RapidJSON's name.
  void Put(char c) {
    if (used_ == piece_.size()) Flush();
    piece_[used_++] = c;
  }
  void write(std::string_view text) {
    while (text.size() > piece_.size() - used_) {
      const std::size_t room = piece_.size() - used_;
      copy(text.substr(0, room));
      text.remove_prefix(room);
      Flush();
    }
    copy(text);
  }
  void putRepeatedly(char c, std::size_t count) {
    if (count > piece_.size() - used_) {
      for (; count > 0; --count) Put(c);
      return;
    }
    std::memset(piece_.data() + used_, c, count);
    used_ += count;
  }
  // NOLINTNEXTLINE(readability-identifier-naming): RapidJSON's name.
  void Flush() {
    if (used_ == 0) return;
    sink_({piece_.data(), used_});
    used_ = 0;
  }

 private:
  void copy(std::string_view text) {
    std::copy(text.begin(), text.end(), piece_.data() + used_);
    used_ += text.size();
  }

  QVJSONOutput::Sink sink_;
  std::array<char, kPieceBytes> piece_;
  std::size_t used_ = 0;
};

// Chosen by RapidJSON for the indentation, instead of putting one blank after the other.
// NOLINTNEXTLINE(readability-identifier-naming): RapidJSON's name.
void PutN(Pieces& pieces, char c, std::size_t count) {
  pieces.putRepeatedly(c, count);
}

class PrettyWriter : public rapidjson::PrettyWriter<Pieces> {
 public:
  using rapidjson::PrettyWriter<Pieces>::PrettyWriter;

  bool plainString(std::string_view text) {
    openString();
    piece(text);
    return closeString();
  }

  void openString() {
    PrettyPrefix(rapidjson::kStringType);
    os_->Put('"');
  }
  void piece(std::string_view text) { os_->write(text); }
  bool closeString() {
    os_->Put('"');
    return true;
  }

  bool number(std::string_view text) {
    PrettyPrefix(rapidjson::kNumberType);
    os_->write(text);
    return true;
  }
};

using Streamer = QVJSONStreamer<PrettyWriter>;

class ArrayStream final : public QVJSONArrayStream {
 public:
  explicit ArrayStream(QVJSONOutput::Sink sink) : pieces_(std::move(sink)) {
    writer_.SetIndent(' ', kIndentation);
    writer_.StartArray();
  }

  std::optional<QVError> append(std::span<const QVDictionaryEntry> members) override {
    if (!failure_ && !streamer_.dictionary(members)) fail({});
    return failure_;
  }

  std::optional<QVError> append(std::string_view name,
                                std::span<const QVDictionaryEntry> members) override {
    if (failure_) return failure_;
    writer_.StartObject();
    streamer_.string(name);
    if (streamer_.dictionary(members)) {
      writer_.EndObject();
    } else {
      fail(name);
    }
    return failure_;
  }

  void end() override { writer_.EndArray(); }

 private:
  void fail(std::string_view name) {
    failure_ = {
        .domain = "net.quillon.json",
        .code = 1,
        .userInfo = {{QVError::kFailureReason,
                      QVText(name, name.empty() ? "" : ": ", '"', streamer_.refusedKey(), "\" is ",
                             streamer_.refusedNumber(), ", which JSON has no word for")}}};
  }

  Pieces pieces_;
  PrettyWriter writer_{pieces_};
  Streamer streamer_{writer_, Streamer::NonFinite::refuse};
  std::optional<QVError> failure_;
};

}  // namespace

std::unique_ptr<QVJSONArrayStream> QVRapidJSONOutput::makeArrayStream(Sink sink) {
  return std::make_unique<ArrayStream>(std::move(sink));
}
