#include "tests/support/QVFrameBuilder.h"

QVFrameBuilder& QVFrameBuilder::align(std::size_t alignment, char padding) {
  while (bytes_.size() % alignment != 0) bytes_.push_back(padding);
  return *this;
}

QVFrameBuilder& QVFrameBuilder::string(std::string_view text) {
  number(static_cast<uint32_t>(text.size()));
  return raw(text).number(uint8_t{0});
}

QVFrameBuilder& QVFrameBuilder::signature(std::string_view text) {
  number(static_cast<uint8_t>(text.size()));
  return raw(text).number(uint8_t{0});
}

QVFrameBuilder& QVFrameBuilder::raw(std::string_view bytes) {
  bytes_.append(bytes);
  return *this;
}

QVFrameBuilder& QVFrameBuilder::field(uint8_t code, std::string_view type, std::string_view text) {
  align(8).number(code).signature(type);
  return type == "g" ? signature(text) : string(text);
}

QVFrameBuilder& QVFrameBuilder::field(uint8_t code, uint32_t value) {
  return align(8).number(code).signature("u").number(value);
}

std::string QVFrame::bytes() const {
  QVFrameBuilder fields(bigEndian);
  if (!path.empty()) fields.field(1, "o", path);
  if (!interface.empty()) fields.field(2, "s", interface);
  if (!member.empty()) fields.field(3, "s", member);
  if (!signature.empty()) fields.field(8, "g", signature);
  if (!moreFields.empty()) fields.align(8).raw(moreFields);

  QVFrameBuilder frame(bigEndian);
  frame.raw(bigEndian ? "B" : "l").number(type).number(flags).number(version);
  frame.number(static_cast<uint32_t>(body.size())).number(serial);
  frame.number(static_cast<uint32_t>(fields.bytes().size()));
  return frame.raw(fields.bytes()).align(8).raw(body).bytes();
}

std::string QVMessageBody::bytes() const {
  QVFrameBuilder body(bigEndian);
  body.number(static_cast<uint32_t>(entries.size())).align(8).raw(entries);
  body.number(uint32_t{0x08000003}).number(uint16_t{1}).number(uint32_t{everySession});
  body.number(static_cast<uint32_t>(sizeof reporterID)).align(8).number(reporterID);
  return body.bytes();
}
