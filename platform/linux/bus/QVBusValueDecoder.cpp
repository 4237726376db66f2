#include "platform/linux/bus/QVBusValueDecoder.h"

#include "platform/QVText.h"

#include <span>
#include <utility>

namespace {

// Values and entries; scratch of that size is kept, which is some hundred KiB at the most.
constexpr std::size_t kScratchKept = 4096;

// Values of one dictionary. A value takes 16 bytes and more however few it took on the wire, so an
// array of bytes would grow twentyfold; this many stay below 16 MiB.
constexpr std::size_t kMostValues = std::size_t{512} << 10;

}  // namespace

QVDictionary QVBusValueDecoder::readDictionary(QVBusReader& reader, QVMemoryCharge* charge) {
  // Of a message that found no memory something is left.
  tidy();
  refusal_ = nullptr;
  values_ = 0;
  const std::size_t end = reader.enterArray(8);
  while (reader.position() < end) {
    reader.enterStruct();
    const auto key = reader.readString();
    addEntry(key, readVariant(reader));
    reader.leaveStruct();
  }
  reader.leaveArray(end);
  QVDictionary dictionary;
  if (reader.ok()) dictionary = QVDictionary::assemble(entries_, charge);
  tidy();
  return dictionary;
}

void QVBusValueDecoder::tidy() {
  entries_.clear();
  items_.clear();
  keys_.clear();
  if (entries_.capacity() > kScratchKept) std::vector<QVDictionaryEntry>().swap(entries_);
  if (items_.capacity() > kScratchKept) std::vector<QVValue>().swap(items_);
}

QVValue QVBusValueDecoder::readVariant(QVBusReader& reader) {
  const auto text = reader.enterVariantText();
  // Nearly all variants hold one basic value and need no look at their signature's grammar.
  QVValue value = text.size() == 1 && QVBusSignature::isBasic(text.front())
                      ? readBasic(reader, text.front())
                      : readVariantOf(reader, text);
  reader.leaveVariant();
  return value;
}

QVValue QVBusValueDecoder::readVariantOf(QVBusReader& reader, std::string_view text) {
  QVBusSignature signature;
  if (!reader.parseVariantSignature(text, signature)) return {};
  return readValue(reader, signature, 0);
}

QVValue QVBusValueDecoder::readValue(QVBusReader& reader, const QVBusSignature& signature,
                                     std::size_t index) {
  switch (signature.typeAt(index)) {
    case 'v':
      return readVariant(reader);
    case 'a':
      if (signature.typeAt(index + 1) == '{') return readEntries(reader, signature, index + 1);
      return readArray(reader, signature, index + 1);
    case '(':
      return readStruct(reader, signature, index);
    default:
      return readBasic(reader, signature.typeAt(index));
  }
}

QVValue QVBusValueDecoder::readBasic(QVBusReader& reader, char type) {
  switch (type) {
    case 'y':
      return reader.readNumber<uint8_t>();
    case 'b':
      return reader.readBoolean();
    case 'n':
      return reader.readNumber<int16_t>();
    case 'q':
      return reader.readNumber<uint16_t>();
    case 'i':
      return reader.readNumber<int32_t>();
    case 'u':
      return reader.readNumber<uint32_t>();
    case 'x':
      return reader.readNumber<int64_t>();
    case 't':
      return reader.readNumber<uint64_t>();
    case 'd':
      return reader.readDouble();
    case 's':
      return QVValue::borrowing(reader.readString());
    case 'o':
      return QVValue::borrowing(reader.readObjectPath());
    case 'g': {
      const auto text = reader.readSignatureText();
      QVBusSignature signature;
      if (!signature.parse(text)) reader.fail("not a signature");
      return QVValue::borrowing(text);
    }
    default:
      // A file descriptor.
      reader.skipBasic(type);
      refusal_ = "file descriptors are not taken";
      return {};
  }
}

QVValue QVBusValueDecoder::readArray(QVBusReader& reader, const QVBusSignature& signature,
                                     std::size_t element) {
  const std::size_t base = items_.size();
  const std::size_t end = reader.enterArray(QVBusSignature::alignmentOf(signature.typeAt(element)));
  while (reader.position() < end) addItem(readValue(reader, signature, element));
  reader.leaveArray(end);
  return takeItems(base);
}

QVValue QVBusValueDecoder::readStruct(QVBusReader& reader, const QVBusSignature& signature,
                                      std::size_t index) {
  const std::size_t base = items_.size();
  reader.enterStruct();
  for (std::size_t end = signature.endOf(index) - 1, member = index + 1; member < end;
       member = signature.endOf(member)) {
    addItem(readValue(reader, signature, member));
  }
  reader.leaveStruct();
  return takeItems(base);
}

// What comes beyond the limit is read, so that the rest is checked, and let go.
bool QVBusValueDecoder::takesOneMore() {
  if (values_ < kMostValues) {
    ++values_;
    return true;
  }
  refusal_ = "no more than 524288 values are taken";
  return false;
}

void QVBusValueDecoder::addItem(QVValue item) {
  if (takesOneMore()) items_.push_back(std::move(item));
}

void QVBusValueDecoder::addEntry(std::string_view key, QVValue value) {
  if (takesOneMore()) entries_.push_back({key, std::move(value)});
}

QVValue QVBusValueDecoder::takeItems(std::size_t base) {
  auto array = QVArray::assemble(std::span(items_).subspan(base));
  items_.resize(base);
  return array;
}

QVValue QVBusValueDecoder::readEntries(QVBusReader& reader, const QVBusSignature& signature,
                                       std::size_t entry) {
  const std::size_t base = entries_.size();
  const std::size_t keyBase = keys_.size();
  const std::size_t end = reader.enterArray(8);
  while (reader.position() < end) {
    reader.enterStruct();
    const auto key = readKey(reader, signature.typeAt(entry + 1));
    addEntry(key, readValue(reader, signature, entry + 2));
    reader.leaveStruct();
  }
  reader.leaveArray(end);
  auto dictionary = QVDictionary::assemble(std::span(entries_).subspan(base));
  entries_.erase(entries_.begin() + static_cast<std::ptrdiff_t>(base), entries_.end());
  keys_.resize(keyBase);
  return dictionary;
}

std::string_view QVBusValueDecoder::readKey(QVBusReader& reader, char type) {
  const QVValue key = readBasic(reader, type);
  // The characters of a borrowed string outlive the value: they lie in the message.
  if (key.isString()) return key.string();
  return keys_.emplace_back(QVText(key));
}
