#include "platform/linux/bus/QVBusReader.h"
#include "platform/linux/bus/QVBusValueDecoder.h"
#include "tests/support/QVTestWire.h"

#include <string>
#include <string_view>
#include <vector>

#include <gtest/gtest.h>

using namespace std::string_literals;

namespace {

// What is wrong with the value of that type in these bytes, "" where nothing is.
std::string faultOfSkipping(std::string_view type, const QVTestWire& value) {
  QVBusSignature signature;
  EXPECT_TRUE(signature.parse(type));
  QVBusReader reader(value.bytes, value.order() == 'B');
  reader.skipValue(signature, 0);
  if (!reader.ok()) return reader.failure();
  return reader.atEnd() ? "" : "bytes left";
}

// The same; the value is also taken in, as the only entry of a dictionary, which must find a fault
// where this one does.
std::string faultOf(std::string_view type, const QVTestWire& value) {
  const std::string fault = faultOfSkipping(type, value);
  QVTestWire wire(value.order());
  // A key of such a length that the value comes to lie at a multiple of 8, as here.
  const std::string key(8 - (7 + type.size()) % 8, 'k');
  wire.u32(0).align(8).string(key).signature(type);
  EXPECT_EQ(wire.bytes.size() % 8, 0U);
  wire.raw(value.bytes);
  wire.setNumber(0, static_cast<uint32_t>(wire.bytes.size() - 8));
  QVBusReader reader(wire.bytes, value.order() == 'B');
  QVBusValueDecoder().readDictionary(reader, nullptr);
  EXPECT_EQ(reader.ok(), fault.empty()) << fault;
  return fault;
}

std::string faultOf(std::string_view type, const std::string& bytes) {
  QVTestWire wire;
  wire.bytes = bytes;
  return faultOf(type, wire);
}

// A value within `arrays` arrays, `structs` structs and `variants` variants, the variants outermost
// and each holding the next.
QVTestWire nested(unsigned variants, unsigned arrays, unsigned structs) {
  const std::string inner =
      std::string(arrays, 'a') + std::string(structs, '(') + "y" + std::string(structs, ')');
  QVTestWire wire;
  for (unsigned i = 1; i < variants; ++i) wire.signature("v");
  if (variants != 0) wire.signature(inner);
  std::vector<std::size_t> lengths;
  std::vector<std::size_t> begins;
  for (unsigned i = 0; i < arrays; ++i) {
    wire.u32(0);
    lengths.push_back(wire.bytes.size() - 4);
    if (i + 1 == arrays && structs != 0) wire.align(8);
    begins.push_back(wire.bytes.size());
  }
  if (structs != 0) wire.align(8);
  wire.u8(1);
  for (std::size_t i = 0; i < lengths.size(); ++i) {
    wire.setNumber(lengths[i], static_cast<uint32_t>(wire.bytes.size() - begins[i]));
  }
  return wire;
}

}  // namespace

TEST(QVBusReader, ReadsNumbersOfEveryWidthInBothByteOrders) {
  for (const char order : {'l', 'B'}) {
    QVTestWire wire(order);
    wire.u8(0xfe).u16(0xfedc).u32(0xfedcba98).u64(0xfedcba9876543210).i64(-2).real(-0.75);
    QVBusReader reader(wire.bytes, order == 'B');
    EXPECT_EQ(reader.readNumber<uint8_t>(), 0xfe);
    EXPECT_EQ(reader.readNumber<uint16_t>(), 0xfedc);
    EXPECT_EQ(reader.readNumber<uint32_t>(), 0xfedcba98);
    EXPECT_EQ(reader.readNumber<uint64_t>(), 0xfedcba9876543210);
    EXPECT_EQ(reader.readNumber<int64_t>(), -2);
    EXPECT_EQ(reader.readDouble(), -0.75);
    EXPECT_TRUE(reader.ok());
    EXPECT_TRUE(reader.atEnd());
  }
}

TEST(QVBusReader, SaysWhyOnceAndAnswersNothingFromThenOn) {
  QVTestWire wire;
  wire.u32(2).string("text");
  QVBusReader reader(wire.bytes, false);
  EXPECT_FALSE(reader.readBoolean());
  EXPECT_EQ(reader.readString(), "");
  EXPECT_EQ(reader.readNumber<uint64_t>(), 0U);
  const std::size_t end = reader.enterArray(4);
  EXPECT_EQ(reader.position(), end);
  reader.leaveArray(end);
  EXPECT_STREQ(reader.failure(), "a boolean is neither 0 nor 1");
}

TEST(QVBusReader, WantsZeroPadding) {
  for (std::size_t at = 1; at < 8; ++at) {
    auto bytes = "\1\0\0\0\0\0\0\0abcdefgh"s;
    bytes[at] = 1;
    EXPECT_EQ(faultOf("(yx)", bytes), "padding is not zero") << at;
  }
  EXPECT_EQ(faultOf("(yx)", "\1\0\0\0\0\0\0\0abcdefgh"s), "");
  // With fewer bytes behind it than a word.
  EXPECT_EQ(faultOf("(yq)", "\1\0ab"s), "");
  EXPECT_EQ(faultOf("(yq)", "\1\1ab"s), "padding is not zero");
}

TEST(QVBusReader, WantsBooleansOfZeroOrOne) {
  EXPECT_EQ(faultOf("b", QVTestWire().u32(0)), "");
  EXPECT_EQ(faultOf("b", QVTestWire().u32(1)), "");
  EXPECT_EQ(faultOf("b", QVTestWire().u32(2)), "a boolean is neither 0 nor 1");
  EXPECT_EQ(faultOf("b", QVTestWire('B').u32(1)), "");
  EXPECT_EQ(faultOf("b", QVTestWire('B').u32(0x01000000)), "a boolean is neither 0 nor 1");
}

TEST(QVBusReader, WantsStringsThatAreEndedAndValid) {
  EXPECT_EQ(faultOf("s", QVTestWire().string("")), "");
  EXPECT_EQ(faultOf("s", QVTestWire().string("gr\u00fcn")), "");
  EXPECT_EQ(faultOf("s", QVTestWire().string("a\0b"s)), "a string is not UTF-8 without NUL");
  EXPECT_EQ(faultOf("s", QVTestWire().string("a\xff")), "a string is not UTF-8 without NUL");
  EXPECT_EQ(faultOf("s", QVTestWire().u32(1).raw("ab")), "a text is not ended by NUL");
  EXPECT_EQ(faultOf("s", QVTestWire().u32(2).raw("ab")), "truncated");
  EXPECT_EQ(faultOf("s", QVTestWire().u32(UINT32_MAX).raw("ab\0"s)), "truncated");
  EXPECT_EQ(faultOf("s", "\1\0"s), "truncated");
}

TEST(QVBusReader, WantsObjectPathsAndSignatures) {
  EXPECT_EQ(faultOf("o", QVTestWire().string("/a/b")), "");
  EXPECT_EQ(faultOf("o", QVTestWire().string("a/b")), "not an object path");
  EXPECT_EQ(faultOf("o", QVTestWire().string("")), "not an object path");
  EXPECT_EQ(faultOf("g", QVTestWire().signature("a{sv}ii")), "");
  EXPECT_EQ(faultOf("g", QVTestWire().signature("")), "");
  EXPECT_EQ(faultOf("g", QVTestWire().signature("a")), "not a signature");
  EXPECT_EQ(faultOf("g", QVTestWire().u8(1).raw("ii")), "a text is not ended by NUL");
  EXPECT_EQ(faultOf("g", QVTestWire().u8(2).raw("ii")), "truncated");
}

TEST(QVBusReader, WantsOneCompleteTypeInAVariant) {
  EXPECT_EQ(faultOf("v", QVTestWire().signature("u").u32(1)), "");
  EXPECT_EQ(faultOf("v", QVTestWire().signature("ai").u32(0)), "");
  for (const auto* bad : {"", "uu", "(i)i", "z", "a", "(", "{sv}"}) {
    EXPECT_EQ(faultOf("v", QVTestWire().signature(bad).u32(1).u32(1)),
              "a variant's signature is not one complete type")
        << bad;
  }
}

TEST(QVBusReader, WantsArraysWhoseLengthFits) {
  EXPECT_EQ(faultOf("ai", QVTestWire().u32(8).u32(1).u32(2)), "");
  EXPECT_EQ(faultOf("ai", QVTestWire().u32(7).u32(1).u32(2)),
            "an array's length does not fit its elements");
  EXPECT_EQ(faultOf("ai", QVTestWire().u32(12).u32(1).u32(2)),
            "an array reaches beyond its message");
  EXPECT_EQ(faultOf("ab", QVTestWire().u32(6).u32(1).u32(0)),
            "an array's length does not fit its elements");
  EXPECT_EQ(faultOf("as", QVTestWire().u32(7).string("abc")),
            "an array's length does not fit its elements");
  EXPECT_EQ(faultOf("a(s)", QVTestWire().u32(8).align(8).string("abc")), "");
  EXPECT_EQ(faultOf("ay", QVTestWire().u32(3).raw("abc")), "");
  EXPECT_EQ(faultOf("ay", QVTestWire().u32(kBusMaximumArrayBytes + 1).raw("abc")),
            "an array larger than 64 MiB");
  EXPECT_EQ(faultOf("ay", QVTestWire().u32(UINT32_MAX).raw("abc")), "an array larger than 64 MiB");
}

TEST(QVBusReader, WantsThePaddingOfAnEmptyArrayToo) {
  EXPECT_EQ(faultOf("(yax)", QVTestWire().u8(1).u32(0)), "");
  EXPECT_EQ(faultOf("ax", QVTestWire().u32(0)), "truncated");
  EXPECT_EQ(faultOf("ax", QVTestWire().u32(0).align(8)), "");
  EXPECT_EQ(faultOf("ax", QVTestWire().u32(0).u32(1)), "padding is not zero");
  EXPECT_EQ(faultOf("aax", QVTestWire().u32(4).u32(0)), "");
}

TEST(QVBusReader, WalksEverythingAtOnce) {
  QVTestWire wire;
  wire.u8(1).u16(2).u32(3).u32(1).u64(4).real(5).string("six").string("/seven").signature("as");
  wire.array(8, [](QVTestWire& entries) {
    entries.align(8).string("k").signature("(iv)").align(8).u32(1).signature("y").u8(1);
    entries.align(8).string("l").signature("a{us}").array(8, [](QVTestWire& inner) {
      inner.align(8).u32(1).string("one").align(8).u32(2).string("two");
    });
  });
  wire.u32(0);
  EXPECT_EQ(faultOf("(yqubtdsoga{sv}h)", wire), "");
  for (std::size_t cut = 0; cut < wire.bytes.size(); ++cut) {
    EXPECT_NE(faultOf("(yqubtdsoga{sv}h)", wire.bytes.substr(0, cut)), "") << cut;
  }
}

TEST(QVBusReader, HoldsToTheDepthOfAWholeMessage) {
  EXPECT_EQ(faultOfSkipping("v", nested(64, 0, 0)), "");
  EXPECT_EQ(faultOfSkipping("v", nested(65, 0, 0)), "containers nested too deeply");
  EXPECT_EQ(faultOfSkipping("v", nested(32, 32, 0)), "");
  EXPECT_EQ(faultOfSkipping("v", nested(33, 32, 0)), "containers nested too deeply");
  EXPECT_EQ(faultOfSkipping("v", nested(1, 32, 31)), "");
  EXPECT_EQ(faultOfSkipping("v", nested(1, 32, 32)), "containers nested too deeply");
  EXPECT_EQ(faultOfSkipping("v", nested(1, 33, 0)),
            "a variant's signature is not one complete type");
  EXPECT_EQ(faultOfSkipping("v", nested(1, 0, 33)),
            "a variant's signature is not one complete type");
  EXPECT_EQ(
      faultOfSkipping(std::string(32, 'a') + std::string(32, '(') + "y" + std::string(32, ')'),
                      nested(0, 32, 32)),
      "");
}
