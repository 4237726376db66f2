#include "platform/linux/bus/QVBusMessage.h"
#include "platform/linux/bus/QVBusWriter.h"
#include "tests/support/QVTestMessage.h"

#include <string>

#include <gtest/gtest.h>

TEST(QVBusWriter, WritesACallAsTheProtocolHasIt) {
  const QVTestMessage expected{.flags = 1,
                               .serial = 9,
                               .member = "SetServiceType",
                               .destination = "a.b",
                               .signature = "qx",
                               .body = QVTestWire().u16(3).i64(-4).bytes};
  std::string bytes;
  QVBusWriter writer(bytes);
  writer.beginMessage({.type = QVBusMessageType::methodCall,
                       .flags = kBusNoReplyExpected,
                       .serial = 9,
                       .path = expected.path,
                       .interface = expected.interface,
                       .member = expected.member,
                       .destination = "a.b",
                       .signature = "qx"});
  writer.writeNumber<uint16_t>(3);
  writer.writeNumber<int64_t>(-4);
  EXPECT_EQ(writer.endMessage(), bytes.size());
  EXPECT_EQ(bytes, expected.bytes());
}

TEST(QVBusWriter, WritesRepliesAndErrorsThatRead) {
  std::string bytes;
  QVBusWriter writer(bytes);
  writer.beginMessage({.type = QVBusMessageType::error,
                       .serial = 3,
                       .replySerial = 8,
                       .errorName = "a.b.Code1",
                       .sender = "c.d",
                       .signature = "s"});
  writer.writeString("why");
  writer.endMessage();
  QVBusMessage message;
  ASSERT_EQ(message.parse(bytes), nullptr);
  EXPECT_EQ(message.checkBody(), nullptr);
  EXPECT_EQ(message.type(), QVBusMessageType::error);
  EXPECT_EQ(message.replySerial(), 8U);
  EXPECT_EQ(message.errorName(), "a.b.Code1");
  EXPECT_EQ(message.sender(), "c.d");
  EXPECT_EQ(message.bodyReader().readString(), "why");
}

TEST(QVBusWriter, AlignsEachMessageFromItsOwnBeginning) {
  std::string bytes = "odd";
  for (uint32_t serial = 1; serial <= 3; ++serial) {
    const std::size_t begin = bytes.size();
    QVBusWriter writer(bytes);
    writer.beginMessage({.type = QVBusMessageType::methodReturn,
                         .serial = serial,
                         .replySerial = 1,
                         .signature = "yb"});
    writer.writeByte(7);
    writer.writeBoolean(true);
    EXPECT_EQ(writer.endMessage(), bytes.size() - begin);
    QVBusMessage message;
    ASSERT_EQ(message.parse(std::string_view(bytes).substr(begin)), nullptr);
    EXPECT_EQ(message.serial(), serial);
    EXPECT_EQ(message.checkBody(), nullptr);
    bytes += "odd";
  }
}

TEST(QVBusWriter, WritesValuesAsVariantsOfTheirKind) {
  QVTestWire expected;
  expected.array(8, [](QVTestWire& wire) {
    wire.entry("b", "b").u32(1);
    wire.entry("d", "d").real(1.5);
    wire.entry("l", "av").array(
        1, [](QVTestWire& items) { items.signature("x").i64(1).signature("s").string("two"); });
    wire.entry("m", "a{sv}").array(8, [](QVTestWire& items) { items.entry("k", "x").i64(2); });
    wire.entry("s", "s").string("text");
    wire.entry("t", "t").u64(UINT64_MAX);
    wire.entry("x", "x").i64(-1);
  });
  std::string bytes;
  QVBusWriter writer(bytes);
  writer.writeDictionary({{"b", true},
                          {"d", 1.5},
                          {"l", QVArray{1, "two"}},
                          {"m", QVDictionary{{"k", 2}}},
                          {"s", "text"},
                          {"t", UINT64_MAX},
                          {"x", -1}});
  EXPECT_EQ(bytes, expected.bytes);
}

TEST(QVBusWriter, LeavesAbsentValuesOut) {
  std::string bytes;
  QVBusWriter writer(bytes);
  writer.writeDictionary({{"absent", QVValue()}, {"l", QVArray{1, QVValue(), 2}}});
  QVTestWire expected;
  expected.array(8, [](QVTestWire& wire) {
    wire.entry("l", "av").array(
        1, [](QVTestWire& items) { items.signature("x").i64(1).signature("x").i64(2); });
  });
  EXPECT_EQ(bytes, expected.bytes);
}
