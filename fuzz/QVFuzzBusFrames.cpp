#include "fuzz/QVFuzzBusFrames.h"

#include "platform/linux/bus/QVBusAuthServer.h"
#include "platform/linux/bus/QVBusFrameDecoder.h"
#include "platform/linux/bus/QVBusMessage.h"
#include "platform/linux/bus/QVBusValueDecoder.h"
#include "platform/linux/bus/QVBusWriter.h"
#include "platform/linux/bus/QVReportingServiceExporter.h"
#include "tests/unit/bus/QVRecordingService.h"

#include <algorithm>
#include <cstdlib>
#include <string>
#include <vector>

namespace {

constexpr uint32_t kUser = 1000;

void require(bool condition) {
  if (!condition) std::abort();
}

struct Stream {
  std::vector<std::string> messages;
  std::string answers;
  const char* failure = nullptr;
};

// Authentication and framing, fed in pieces of that size.
Stream cut(std::string_view input, std::size_t pieceSize) {
  Stream stream;
  QVBusAuthServer authentication(kUser, "0123456789abcdef0123456789abcdef");
  QVBusFrameDecoder decoder;
  while (!input.empty()) {
    // Memory of its own, so that a look beyond the piece is seen.
    const std::string piece(input.substr(0, pieceSize));
    input.remove_prefix(piece.size());
    std::string_view rest = piece;
    if (authentication.state() != QVBusAuthServer::State::done) {
      rest.remove_prefix(authentication.feed(rest, stream.answers));
      if (authentication.state() == QVBusAuthServer::State::failed) {
        stream.failure = authentication.failure();
        return stream;
      }
      if (authentication.state() != QVBusAuthServer::State::done) continue;
    }
    decoder.feed(rest);
    std::string_view message;
    QVBusFrameDecoder::Result result;
    while ((result = decoder.next(message)) == QVBusFrameDecoder::Result::message) {
      stream.messages.emplace_back(message);
    }
    if (result == QVBusFrameDecoder::Result::malformed) {
      stream.failure = decoder.failure();
      return stream;
    }
  }
  return stream;
}

// A body that is in order and begins with a dictionary can be taken in, and what was taken in comes
// back the same when it is written and taken in again.
bool survivesTheWayBack(const QVBusMessage& message) {
  if (!message.signature().starts_with("a{sv}")) return false;
  QVBusValueDecoder decoder;
  auto reader = message.bodyReader();
  const auto dictionary = decoder.readDictionary(reader, nullptr);
  require(reader.ok());
  if (decoder.refusal() != nullptr) return false;

  std::string bytes;
  QVBusWriter(bytes).writeDictionary(dictionary);
  QVBusReader again(bytes, false);
  const auto copy = decoder.readDictionary(again, nullptr);
  // Arrays become arrays of variants, which nest twice as deep; nothing else may fail.
  if (!again.ok()) {
    require(std::string_view(again.failure()) == "containers nested too deeply");
    return false;
  }
  require(again.atEnd());
  require(copy == dictionary);
  return true;
}

}  // namespace

QVFuzzBusProgress QVFuzzBusFrames(std::string_view input) {
  QVFuzzBusProgress progress;
  if (input.empty()) return progress;
  const std::size_t pieceSize = static_cast<unsigned char>(input.front()) + std::size_t{1};
  input.remove_prefix(1);

  const Stream stream = cut(input, pieceSize);
  const Stream whole = cut(input, input.size());
  require(stream.messages == whole.messages);
  require(stream.answers == whole.answers);
  require((stream.failure == nullptr) == (whole.failure == nullptr));

  QVBusKnownHeader known;
  QVReportingServiceExporter exporter;
  QVRecordingService service;
  for (const auto& bytes : stream.messages) {
    QVBusMessage message, quick;
    const bool inOrder = message.parse(bytes) == nullptr;
    require((quick.parse(bytes, known) == nullptr) == inOrder);
    if (!inOrder) break;
    require(quick.member() == message.member() && quick.path() == message.path());
    require(quick.body() == message.body() && quick.signature() == message.signature());
    ++progress.messages;

    const bool bodyInOrder = message.checkBody() == nullptr;
    if (bodyInOrder) {
      ++progress.bodies;
      if (survivesTheWayBack(message)) ++progress.dictionaries;
    }
    if (message.type() == QVBusMessageType::methodCall) {
      const char* reason = exporter.handle({.message = quick,
                                            .reply = QVBusReply(),
                                            .object = &service,
                                            .charge = nullptr,
                                            .connectionNumber = 1});
      require((reason == nullptr) == bodyInOrder);
    }
  }
  progress.calls = service.calls.size();
  return progress;
}
