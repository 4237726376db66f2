#include "platform/linux/bus/QVBusReader.h"

#include "platform/linux/bus/QVBusNames.h"

void QVBusReader::fail(const char* reason) noexcept {
  if (failure_ == nullptr) failure_ = reason;
  // At the end nothing is left to be read, and every loop over an array ends.
  position_ = bytes_.size();
}

void QVBusReader::skipPadding(std::size_t aligned) noexcept {
  if (aligned > bytes_.size()) {
    fail("truncated");
    return;
  }
  for (; position_ < aligned; ++position_) {
    if (bytes_[position_] != 0) {
      fail("padding is not zero");
      return;
    }
  }
}

bool QVBusReader::readBoolean() noexcept {
  const auto number = readNumber<uint32_t>();
  if (number > 1) fail("a boolean is neither 0 nor 1");
  return number == 1;
}

std::string_view QVBusReader::readObjectPath() noexcept {
  const auto path = readString();
  if (ok() && !QVBusIsValidObjectPath(path)) {
    fail("not an object path");
    return {};
  }
  return path;
}

std::size_t QVBusReader::enterArray(std::size_t elementAlignment) noexcept {
  deepen();
  const std::size_t length = readNumber<uint32_t>();
  if (length > kBusMaximumArrayBytes) fail("an array larger than 64 MiB");
  // The padding to the first element is there without elements, too, and not counted.
  align(elementAlignment);
  if (bytes_.size() - position_ < length) fail("an array reaches beyond its message");
  return ok() ? position_ + length : position_;
}

void QVBusReader::leaveArray(std::size_t end) noexcept {
  --depth_;
  if (position_ != end) fail("an array's length does not fit its elements");
}

bool QVBusReader::parseVariantSignature(std::string_view text, QVBusSignature& signature) noexcept {
  if (!ok()) return false;
  if (signature.parse(text) && signature.isSingleType()) return true;
  fail("a variant's signature is not one complete type");
  return false;
}

void QVBusReader::skipBasic(char type) noexcept {
  switch (type) {
    case 'y':
      readNumber<uint8_t>();
      break;
    case 'b':
      readBoolean();
      break;
    case 'n':
    case 'q':
      readNumber<uint16_t>();
      break;
    case 'i':
    case 'u':
    case 'h':
      readNumber<uint32_t>();
      break;
    case 'x':
    case 't':
    case 'd':
      readNumber<uint64_t>();
      break;
    case 's':
      readString();
      break;
    case 'o':
      readObjectPath();
      break;
    case 'g': {
      QVBusSignature signature;
      if (!signature.parse(readSignatureText())) fail("not a signature");
      break;
    }
    default:
      fail("not a type");
      break;
  }
}

void QVBusReader::skipValue(const QVBusSignature& signature, std::size_t index) noexcept {
  switch (signature.typeAt(index)) {
    case 'v':
      skipVariant();
      break;
    case 'a':
      skipArray(signature, index + 1);
      break;
    case '(':
    case '{':
      enterStruct();
      // Up to the closing bracket, which is the last character of the type.
      for (std::size_t end = signature.endOf(index) - 1, member = index + 1; member < end && ok();
           member = signature.endOf(member)) {
        skipValue(signature, member);
      }
      leaveStruct();
      break;
    default:
      skipBasic(signature.typeAt(index));
      break;
  }
}

void QVBusReader::skipVariant() noexcept {
  const auto text = enterVariantText();
  QVBusSignature signature;
  if (parseVariantSignature(text, signature)) skipValue(signature, 0);
  leaveVariant();
}

void QVBusReader::skipArray(const QVBusSignature& signature, std::size_t element) noexcept {
  const char type = signature.typeAt(element);
  const std::size_t end = enterArray(QVBusSignature::alignmentOf(type));
  if (const std::size_t size = QVBusSignature::fixedSizeOf(type); size != 0 && ok()) {
    // Elements lie without gaps and any bits will do.
    if ((end - position_) % size == 0) position_ = end;
  } else {
    while (position_ < end) skipValue(signature, element);
  }
  leaveArray(end);
}
