#include "platform/linux/store/QVJSONText.h"

#include "platform/linux/output/QVJSONStreamer.h"

#include <algorithm>
#include <cstddef>

#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>

namespace {

// A buffer that one large text has grown beyond this is given back, in bytes.
constexpr std::size_t kKeptBufferBytes = std::size_t{256} * 1024;

class CompactWriter : public rapidjson::Writer<rapidjson::StringBuffer> {
 public:
  using Writer::Writer;

  bool plainString(std::string_view text) {
    Prefix(rapidjson::kStringType);
    char* place = os_->Push(text.size() + 2);
    *place++ = '"';
    place = std::copy(text.begin(), text.end(), place);
    *place = '"';
    return EndValue(true);
  }

  void openString() {
    Prefix(rapidjson::kStringType);
    os_->Put('"');
  }
  void piece(std::string_view text) { std::copy(text.begin(), text.end(), os_->Push(text.size())); }
  bool closeString() {
    os_->Put('"');
    return EndValue(true);
  }

  bool number(std::string_view text) {
    Prefix(rapidjson::kNumberType);
    piece(text);
    return EndValue(true);
  }
};

using Streamer = QVJSONStreamer<CompactWriter>;

}  // namespace

struct QVJSONText::State {
  rapidjson::StringBuffer buffer;
  CompactWriter writer{buffer};

  void clear() {
    const bool large = buffer.GetSize() > kKeptBufferBytes;
    buffer.Clear();
    if (large) buffer.ShrinkToFit();
  }

  template <class Part>
  std::string_view write(Part part) {
    clear();
    writer.Reset(buffer);
    Streamer streamer(writer, Streamer::NonFinite::quote);
    static_cast<void>(part(streamer));  // nothing is refused where everything has a word
    return {buffer.GetString(), buffer.GetSize()};
  }
};

QVJSONText::QVJSONText() : state_(std::make_unique<State>()) {}

QVJSONText::~QVJSONText() = default;

void QVJSONText::clear() {
  state_->clear();
}

std::string_view QVJSONText::write(const QVValue& value) {
  return state_->write([&value](Streamer& streamer) { return streamer.value(value); });
}

std::string_view QVJSONText::write(const QVDictionary& value) {
  return state_->write([&value](Streamer& streamer) { return streamer.dictionary(value); });
}
