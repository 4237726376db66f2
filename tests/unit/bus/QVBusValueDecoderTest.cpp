#include "platform/QVText.h"
#include "platform/fake/QVFakeMemoryCharge.h"
#include "platform/linux/bus/QVBusValueDecoder.h"
#include "platform/linux/bus/QVBusWriter.h"
#include "tests/support/QVTestWire.h"

#include <limits>
#include <string>

#include <gtest/gtest.h>

namespace {

// A dictionary of what `entries` writes, taken in.
template <class Entries>
QVDictionary decode(char order, Entries&& entries, QVMemoryCharge* charge = nullptr,
                    bool* refused = nullptr) {
  QVTestWire wire(order);
  wire.array(8, entries);
  QVBusReader reader(wire.bytes, order == 'B');
  QVBusValueDecoder decoder;
  const auto dictionary = decoder.readDictionary(reader, charge);
  EXPECT_TRUE(reader.ok()) << reader.failure();
  EXPECT_TRUE(reader.atEnd());
  if (refused != nullptr) *refused = decoder.refusal() != nullptr;
  return dictionary;
}

class QVBusValueDecoderBothOrders : public testing::TestWithParam<char> {};

}  // namespace

INSTANTIATE_TEST_SUITE_P(Orders, QVBusValueDecoderBothOrders, testing::Values('l', 'B'));

TEST_P(QVBusValueDecoderBothOrders, TakesEveryBasicType) {
  const auto dictionary = decode(GetParam(), [](QVTestWire& wire) {
    wire.entry("y", "y").u8(200);
    wire.entry("n", "n").u16(static_cast<uint16_t>(-2));
    wire.entry("q", "q").u16(65535);
    wire.entry("i", "i").u32(static_cast<uint32_t>(-3));
    wire.entry("u", "u").u32(4294967295);
    wire.entry("x", "x").i64(std::numeric_limits<int64_t>::min());
    wire.entry("t", "t").u64(std::numeric_limits<int64_t>::max());
    wire.entry("T", "t").u64(std::numeric_limits<uint64_t>::max());
    wire.entry("d", "d").real(0.1);
    wire.entry("b", "b").u32(1);
    wire.entry("s", "s").string("text");
    wire.entry("o", "o").string("/a");
    wire.entry("g", "g").signature("ai");
  });
  EXPECT_EQ(dictionary, (QVDictionary{{"y", 200},
                                      {"n", -2},
                                      {"q", 65535},
                                      {"i", -3},
                                      {"u", 4294967295},
                                      {"x", std::numeric_limits<int64_t>::min()},
                                      {"t", std::numeric_limits<int64_t>::max()},
                                      {"T", std::numeric_limits<uint64_t>::max()},
                                      {"d", 0.1},
                                      {"b", true},
                                      {"s", "text"},
                                      {"o", "/a"},
                                      {"g", "ai"}}));
  EXPECT_EQ(dictionary.find("t")->kind(), QVValue::Kind::integer);
  EXPECT_EQ(dictionary.find("T")->kind(), QVValue::Kind::unsignedInteger);
  EXPECT_EQ(dictionary.find("b")->kind(), QVValue::Kind::boolean);
}

TEST_P(QVBusValueDecoderBothOrders, TakesContainersInEachOther) {
  const auto dictionary = decode(GetParam(), [](QVTestWire& wire) {
    wire.entry("strings", "as").array(4, [](QVTestWire& items) { items.string("a").string("bc"); });
    wire.entry("bytes", "ay").array(1, [](QVTestWire& items) { items.u8(1).u8(255); });
    wire.entry("variants", "av").array(1, [](QVTestWire& items) {
      items.signature("s").string("x").signature("v").signature("u").u32(5);
    });
    wire.entry("struct", "(s(iu)b)").align(8).string("y").align(8).u32(1).u32(2).u32(0);
    wire.entry("nested", "a{sv}").array(8, [](QVTestWire& items) {
      items.entry("in", "a{sv}").array(8, [](QVTestWire& inner) {
        inner.entry("er", "s").string("z");
      });
    });
    wire.entry("empty", "a{sv}").array(8, [](QVTestWire&) {});
    wire.entry("none", "ai").array(4, [](QVTestWire&) {});
  });
  EXPECT_EQ(QVText(dictionary),
            R"({"bytes":[1,255],"empty":{},"nested":{"in":{"er":"z"}},"none":[],)"
            R"("strings":["a","bc"],"struct":["y",[1,2],false],"variants":["x",5]})");
}

TEST_P(QVBusValueDecoderBothOrders, MakesKeysOfOtherTypesTexts) {
  const auto dictionary = decode(GetParam(), [](QVTestWire& wire) {
    wire.entry("numbers", "a{is}").array(8, [](QVTestWire& items) {
      items.align(8).u32(static_cast<uint32_t>(-1)).string("minus");
      items.align(8).u32(10).string("ten");
      items.align(8).u32(9).string("nine");
    });
    wire.entry("booleans", "a{bu}").array(8, [](QVTestWire& items) {
      items.align(8).u32(1).u32(7);
    });
    wire.entry("reals", "a{da{ty}}").array(8, [](QVTestWire& items) {
      items.align(8).real(0.5).array(8, [](QVTestWire& inner) {
        inner.align(8).u64(std::numeric_limits<uint64_t>::max()).u8(1);
      });
      items.align(8).real(12).array(8, [](QVTestWire&) {});
    });
    wire.entry("paths", "a{os}").array(8, [](QVTestWire& items) {
      items.align(8).string("/a").string("b");
    });
  });
  EXPECT_EQ(QVText(dictionary),
            R"({"booleans":{"1":7},"numbers":{"-1":"minus","10":"ten","9":"nine"},)"
            R"("paths":{"/a":"b"},"reals":{"0.5":{"18446744073709551615":1},"12":{}}})");
}

TEST(QVBusValueDecoder, LetsTheLaterOfEqualKeysWin) {
  const auto dictionary = decode('l', [](QVTestWire& wire) {
    wire.entry("k", "u").u32(1);
    wire.entry("a", "u").u32(2);
    wire.entry("k", "s").string("later");
    wire.entry("in", "a{us}").array(8, [](QVTestWire& items) {
      items.align(8).u32(1).string("first");
      items.align(8).u32(1).string("second");
    });
  });
  EXPECT_EQ(QVText(dictionary), R"({"a":2,"in":{"1":"second"},"k":"later"})");
}

TEST(QVBusValueDecoder, RefusesDescriptorsWhereverTheyAre) {
  bool refused = false;
  decode(
      'l', [](QVTestWire& wire) { wire.entry("k", "u").u32(1); }, nullptr, &refused);
  EXPECT_FALSE(refused);
  decode(
      'l', [](QVTestWire& wire) { wire.entry("k", "h").u32(0); }, nullptr, &refused);
  EXPECT_TRUE(refused);
  decode(
      'l', [](QVTestWire& wire) { wire.entry("k", "(ih)").align(8).u32(0).u32(0); }, nullptr,
      &refused);
  EXPECT_TRUE(refused);
  decode(
      'l',
      [](QVTestWire& wire) {
        wire.entry("k", "a{hs}").array(8, [](QVTestWire& items) {
          items.align(8).u32(0).string("x");
        });
      },
      nullptr, &refused);
  EXPECT_TRUE(refused);
}

TEST(QVBusValueDecoder, ForgetsARefusalWithTheNextDictionary) {
  QVBusValueDecoder decoder;
  QVTestWire bad, good;
  bad.array(8, [](QVTestWire& wire) { wire.entry("k", "h").u32(0); });
  good.array(8, [](QVTestWire& wire) { wire.entry("k", "u").u32(0); });
  QVBusReader badReader(bad.bytes, false), goodReader(good.bytes, false);
  decoder.readDictionary(badReader, nullptr);
  EXPECT_NE(decoder.refusal(), nullptr);
  EXPECT_EQ(decoder.readDictionary(goodReader, nullptr), (QVDictionary{{"k", 0}}));
  EXPECT_EQ(decoder.refusal(), nullptr);
}

TEST(QVBusValueDecoder, OwnsWhatItMadeAndChargesIt) {
  QVFakeMemoryCharge charge;
  QVDictionary dictionary;
  {
    std::string bytes = [] {
      QVTestWire wire;
      wire.array(8, [](QVTestWire& entries) {
        entries.entry("key", "s").string("a value of some length");
        entries.entry("list", "as").array(4, [](QVTestWire& items) { items.string("item"); });
      });
      return wire.bytes;
    }();
    QVBusReader reader(bytes, false);
    dictionary = QVBusValueDecoder().readDictionary(reader, &charge);
    std::fill(bytes.begin(), bytes.end(), '\xff');
  }
  EXPECT_EQ(QVText(dictionary), R"({"key":"a value of some length","list":["item"]})");
  EXPECT_EQ(charge.held(), dictionary.footprint());
  EXPECT_GT(charge.held(), 0U);
  dictionary = {};
  EXPECT_EQ(charge.held(), 0U);
}

TEST(QVBusValueDecoder, ChargesNothingForWhatIsBroken) {
  QVFakeMemoryCharge charge;
  QVTestWire wire;
  wire.array(8, [](QVTestWire& entries) {
    entries.entry("key", "s").string("value");
    entries.entry("bad", "b").u32(2);
  });
  QVBusReader reader(wire.bytes, false);
  QVBusValueDecoder decoder;
  EXPECT_TRUE(decoder.readDictionary(reader, &charge).isAbsent());
  EXPECT_FALSE(reader.ok());
  EXPECT_EQ(charge.held(), 0U);
}

TEST(QVBusValueDecoder, TakesInWhatTheWriterMade) {
  const QVDictionary dictionary{
      {"boolean", true},
      {"integer", -5},
      {"large", std::numeric_limits<uint64_t>::max()},
      {"list", QVArray{1, "two", 3.5, QVArray{}, QVDictionary{{"k", "v"}}}},
      {"real", 1e300},
      {"table", QVDictionary{{"a", QVDictionary{{"b", QVArray{true}}}}}},
      {"text", "gr\u00fcn"}};
  std::string bytes;
  QVBusWriter writer(bytes);
  writer.writeDictionary(dictionary);
  QVBusReader reader(bytes, false);
  EXPECT_EQ(QVBusValueDecoder().readDictionary(reader, nullptr), dictionary);
  EXPECT_TRUE(reader.ok());
  EXPECT_TRUE(reader.atEnd());
}

TEST(QVBusValueDecoder, TakesThousandsOfEntriesAndItems) {
  const auto dictionary = decode('l', [](QVTestWire& wire) {
    for (int i = 0; i < 10000; ++i) wire.entry("key" + std::to_string(i), "s").string("v");
    wire.entry("list", "ai").array(4, [](QVTestWire& items) {
      for (uint32_t i = 0; i < 10000; ++i) items.u32(i);
    });
  });
  EXPECT_EQ(dictionary.size(), 10001U);
  EXPECT_EQ(dictionary.find("key9999")->string(), "v");
  EXPECT_EQ(dictionary.find("list")->array()[9999].integer(), 9999);
}
