#pragma once

#include "platform/QVValue.h"
#include "platform/linux/bus/QVBusReader.h"

#include <deque>
#include <string>
#include <string_view>
#include <vector>

// Makes dictionaries of the a{sv} in messages: integers of all widths become integers, strings,
// object paths and signatures strings, structs arrays, dictionary entries dictionaries (keys of
// other types than string in their text form; of equal keys the later one wins), variants what they
// hold. A file descriptor has no counterpart, and there is a limit to how many
// values are taken: refusal() tells.
//
// Holds scratch memory that lasts from one message to the next, so that a flat dictionary costs one
// allocation, that of its own block, and its texts are copied once. One serves all connections of a
// thread.
//
// Threads: one at a time.
// Limits: scratch that a large message made larger than 4,096 values is given back.
class QVBusValueDecoder {
 public:
  // Reads one a{sv}. What is broken shows in the reader; the dictionary is then of no use.
  QVDictionary readDictionary(QVBusReader& reader, QVMemoryCharge* charge);

  // Why the last dictionary, though well-formed, cannot be taken; null where it can.
  const char* refusal() const noexcept { return refusal_; }

 private:
  QVValue readVariant(QVBusReader& reader);
  QVValue readVariantOf(QVBusReader& reader, std::string_view text);
  QVValue readValue(QVBusReader& reader, const QVBusSignature& signature, std::size_t index);
  QVValue readBasic(QVBusReader& reader, char type);
  QVValue readArray(QVBusReader& reader, const QVBusSignature& signature, std::size_t element);
  QVValue readStruct(QVBusReader& reader, const QVBusSignature& signature, std::size_t index);
  QVValue readEntries(QVBusReader& reader, const QVBusSignature& signature, std::size_t entry);
  std::string_view readKey(QVBusReader& reader, char type);
  bool takesOneMore();
  void addItem(QVValue item);
  void addEntry(std::string_view key, QVValue value);
  QVValue takeItems(std::size_t base);
  void tidy();

  // Stacks: what lies above the size at which a container began is the container's.
  std::vector<QVDictionaryEntry> entries_;
  std::vector<QVValue> items_;
  std::deque<std::string> keys_;  // keys in text form; a deque's elements stay where they are
  const char* refusal_ = nullptr;
  std::size_t values_ = 0;  // of the dictionary that is read
};
