#pragma once

#include "platform/linux/bus/QVBusOutbox.h"

#include <cstdint>
#include <memory>
#include <string_view>
#include <utility>

// The answer to one call, still to be given: by anybody, on any thread, at any time, twice, or
// never. Does nothing where no reply is expected or the connection has closed.
//
// A copyable value, small enough to be captured by a reply callback in place.
class QVBusReply {
 public:
  // No reply is expected.
  QVBusReply() = default;
  QVBusReply(std::shared_ptr<QVBusOutbox> outbox, uint32_t callSerial)
      : outbox_(std::move(outbox)), callSerial_(callSerial) {}

  // A method return with values of that signature, written by `body(QVBusWriter&)`.
  template <class Body>
  void give(std::string_view signature, Body&& body) const {
    if (outbox_ == nullptr) return;
    outbox_->put({.type = QVBusMessageType::methodReturn,
                  .flags = kBusNoReplyExpected,
                  .replySerial = callSerial_,
                  .signature = signature},
                 std::forward<Body>(body));
  }
  void giveNothing() const {
    give({}, [](QVBusWriter&) {});
  }
  void giveBoolean(bool value) const {
    give("b", [value](QVBusWriter& writer) { writer.writeBoolean(value); });
  }
  void giveString(std::string_view value) const {
    give("s", [value](QVBusWriter& writer) { writer.writeString(value); });
  }
  // An error. The name must be a valid one, the text valid UTF-8.
  void giveError(std::string_view name, std::string_view text) const {
    if (outbox_ == nullptr) return;
    outbox_->put({.type = QVBusMessageType::error,
                  .flags = kBusNoReplyExpected,
                  .replySerial = callSerial_,
                  .errorName = name,
                  .signature = "s"},
                 [text](QVBusWriter& writer) { writer.writeString(text); });
  }

 private:
  std::shared_ptr<QVBusOutbox> outbox_;
  uint32_t callSerial_ = 0;
};
