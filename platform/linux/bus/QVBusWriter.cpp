#include "platform/linux/bus/QVBusWriter.h"

#include <bit>

void QVBusWriter::beginMessage(const QVBusHeader& header) {
  start_ = out_.size();
  const char fixed[] = {'l', static_cast<char>(header.type), static_cast<char>(header.flags),
                        static_cast<char>(kBusProtocolVersion)};
  out_.append(fixed, sizeof fixed);
  writeNumber<uint32_t>(0);  // the body's length, entered by endMessage()
  writeNumber<uint32_t>(header.serial);
  const auto fields = beginArray(8);
  if (!header.path.empty()) writeField(QVBusField::path, 'o', header.path);
  if (!header.interface.empty()) writeField(QVBusField::interface, 's', header.interface);
  if (!header.member.empty()) writeField(QVBusField::member, 's', header.member);
  if (!header.errorName.empty()) writeField(QVBusField::errorName, 's', header.errorName);
  if (header.replySerial != 0) {
    beginStruct();
    writeByte(static_cast<uint8_t>(QVBusField::replySerial));
    beginVariant("u");
    writeNumber<uint32_t>(header.replySerial);
  }
  if (!header.destination.empty()) writeField(QVBusField::destination, 's', header.destination);
  if (!header.sender.empty()) writeField(QVBusField::sender, 's', header.sender);
  if (!header.signature.empty()) writeField(QVBusField::signature, 'g', header.signature);
  endArray(fields);
  align(8);
  bodyStart_ = out_.size();
}

std::size_t QVBusWriter::endMessage() {
  store(out_.data() + start_ + 4, static_cast<uint32_t>(out_.size() - bodyStart_));
  return out_.size() - start_;
}

void QVBusWriter::writeField(QVBusField code, char type, std::string_view text) {
  beginStruct();
  const char start[] = {static_cast<char>(code), 1, type, 0};
  out_.append(start, sizeof start);
  if (type == 'g') {
    writeSignature(text);
  } else {
    writeString(text);
  }
}

void QVBusWriter::writeDouble(double value) {
  writeNumber<uint64_t>(std::bit_cast<uint64_t>(value));
}

void QVBusWriter::writeString(std::string_view value) {
  writeNumber<uint32_t>(static_cast<uint32_t>(value.size()));
  out_.append(value);
  out_.push_back('\0');
}

void QVBusWriter::writeSignature(std::string_view value) {
  writeByte(static_cast<uint8_t>(value.size()));
  out_.append(value);
  out_.push_back('\0');
}

QVBusWriter::Array QVBusWriter::beginArray(std::size_t elementAlignment) {
  align(4);
  const std::size_t lengthAt = out_.size();
  writeNumber<uint32_t>(0);
  align(elementAlignment);
  return {lengthAt, out_.size()};
}

void QVBusWriter::endArray(Array array) {
  store(out_.data() + array.lengthAt, static_cast<uint32_t>(out_.size() - array.begin));
}

void QVBusWriter::writeVariant(const QVValue& value) {
  switch (value.kind()) {
    case QVValue::Kind::absent:
      break;
    case QVValue::Kind::boolean:
      beginVariant("b");
      writeBoolean(value.boolean());
      break;
    case QVValue::Kind::integer:
      beginVariant("x");
      writeNumber<int64_t>(value.integer());
      break;
    case QVValue::Kind::unsignedInteger:
      beginVariant("t");
      writeNumber<uint64_t>(value.unsignedInteger());
      break;
    case QVValue::Kind::real:
      beginVariant("d");
      writeDouble(value.real());
      break;
    case QVValue::Kind::string:
      beginVariant("s");
      writeString(value.string());
      break;
    case QVValue::Kind::array: {
      beginVariant("av");
      const QVArray items = value.array();
      const auto array = beginArray(1);
      for (const QVValue& item : items) {
        if (!item.isAbsent()) writeVariant(item);
      }
      endArray(array);
      break;
    }
    case QVValue::Kind::dictionary:
      beginVariant("a{sv}");
      writeDictionary(value.dictionary());
      break;
  }
}

void QVBusWriter::writeDictionary(const QVDictionary& dictionary) {
  const auto array = beginArray(8);
  for (const auto& entry : dictionary) {
    if (entry.value.isAbsent()) continue;
    beginStruct();
    writeString(entry.key);
    writeVariant(entry.value);
  }
  endArray(array);
}
