#include "platform/linux/bus/QVBusMessage.h"
#include "tests/support/QVTestMessage.h"

#include <string>
#include <string_view>

#include <gtest/gtest.h>

using namespace std::string_literals;

namespace {

// What the header of these bytes breaks, "" where it is in order.
std::string faultOf(const std::string& bytes) {
  QVBusMessage message;
  const char* reason = message.parse(bytes);
  // The quick way must say the same, also the second time.
  QVBusKnownHeader known;
  for (int i = 0; i < 2; ++i) {
    QVBusMessage again;
    const char* same = again.parse(bytes, known);
    EXPECT_EQ(std::string_view(same == nullptr ? "" : same), reason == nullptr ? "" : reason);
  }
  return reason == nullptr ? "" : reason;
}

std::string field(uint8_t code, std::string_view type, std::string_view value, char order = 'l') {
  return QVTestWire(order).field(code, type, value).bytes;
}

std::string numberField(uint8_t code, uint32_t value, char order = 'l') {
  return QVTestWire(order).field(code, value).bytes;
}

QVTestMessage bare(uint8_t type, std::string moreFields) {
  return {
      .type = type, .path = "", .interface = "", .member = "", .moreFields = std::move(moreFields)};
}

}  // namespace

TEST(QVBusMessage, ReadsTheHeaderInBothByteOrders) {
  for (const char order : {'l', 'B'}) {
    const auto bytes = QVTestMessage{.order = order,
                                     .flags = 1,
                                     .serial = 0x01020304,
                                     .destination = "net.quillon.quietvox",
                                     .signature = "x",
                                     .body = QVTestWire(order).i64(-7).bytes,
                                     .moreFields = field(7, "s", ":1.5", order)}
                           .bytes();
    QVBusMessage message;
    ASSERT_EQ(message.parse(bytes), nullptr);
    EXPECT_EQ(message.type(), QVBusMessageType::methodCall);
    EXPECT_TRUE(message.noReplyExpected());
    EXPECT_EQ(message.serial(), 0x01020304U);
    EXPECT_EQ(message.path(), "/net/quillon/quietvox/ReportingService");
    EXPECT_EQ(message.interface(), "net.quillon.quietvox.ReportingService");
    EXPECT_EQ(message.member(), "CreateReportingSession");
    EXPECT_EQ(message.destination(), "net.quillon.quietvox");
    EXPECT_EQ(message.sender(), ":1.5");
    EXPECT_EQ(message.signature(), "x");
    EXPECT_EQ(message.bodyReader().readNumber<int64_t>(), -7);
    EXPECT_EQ(message.checkBody(), nullptr);
  }
}

TEST(QVBusMessage, ReadsRepliesAndErrors) {
  for (const char order : {'l', 'B'}) {
    auto made = bare(2, numberField(5, 77, order));
    made.order = order;
    QVBusMessage message;
    auto bytes = made.bytes();
    ASSERT_EQ(message.parse(bytes), nullptr);
    EXPECT_EQ(message.type(), QVBusMessageType::methodReturn);
    EXPECT_EQ(message.replySerial(), 77U);
    made.type = 3;
    made.moreFields = QVTestWire(order)
                          .raw(made.moreFields)
                          .align(8)
                          .raw(field(4, "s", "a.b.Code1", order))
                          .bytes;
    bytes = made.bytes();
    ASSERT_EQ(message.parse(bytes), nullptr);
    EXPECT_EQ(message.errorName(), "a.b.Code1");
  }
}

TEST(QVBusMessage, RemembersFieldsOnlyWhileTheyAreTheSame) {
  QVBusKnownHeader known;
  QVBusMessage message;
  const auto call = [&](const QVTestMessage& made) {
    const auto bytes = made.bytes();
    EXPECT_EQ(message.parse(bytes, known), nullptr);
    // The views must not lie in `bytes` alone, nor point to what went with an earlier message.
    return std::string(message.member()) + " " + std::string(message.path()) + " " +
           std::to_string(message.serial()) + " " + std::to_string(message.body().size());
  };
  EXPECT_EQ(call({.serial = 1, .path = "/a", .member = "One"}), "One /a 1 0");
  EXPECT_EQ(call({.serial = 2, .path = "/a", .member = "One"}), "One /a 2 0");
  EXPECT_EQ(call({.serial = 3, .path = "/b", .member = "One"}), "One /b 3 0");
  EXPECT_EQ(call({.serial = 4, .path = "/b", .member = "Two"}), "Two /b 4 0");
  EXPECT_EQ(
      call({.serial = 5, .path = "/b", .member = "Two", .signature = "x", .body = "12345678"}),
      "Two /b 5 8");
  EXPECT_EQ(call({.serial = 6,
                  .path = "/b",
                  .member = "Two",
                  .signature = "xx",
                  .body = "1234567812345678"}),
            "Two /b 6 16");
  EXPECT_EQ(call({.order = 'B', .serial = 7, .path = "/b", .member = "Two"}), "Two /b 7 0");
  EXPECT_EQ(call({.serial = 8, .path = "/b", .member = "Two"}), "Two /b 8 0");
  // Longer than what is remembered.
  const std::string longPath = "/" + std::string(300, 'x');
  EXPECT_EQ(call({.serial = 9, .path = longPath, .member = "Two"}), "Two " + longPath + " 9 0");
  EXPECT_EQ(call({.serial = 10, .path = longPath, .member = "Two"}), "Two " + longPath + " 10 0");
}

TEST(QVBusMessage, ChecksWhatDiffersAlsoWhereTheFieldsAreKnown) {
  QVBusKnownHeader known;
  QVBusMessage message;
  const QVTestMessage good{.signature = ""};
  ASSERT_EQ(message.parse(good.bytes(), known), nullptr);
  auto bad = good;
  bad.serial = 0;
  EXPECT_STREQ(message.parse(bad.bytes(), known), "message without a serial");
  bad = good;
  bad.body = "body";
  EXPECT_STREQ(message.parse(bad.bytes(), known), "body without a signature");
  bad = good;
  bad.type = 2;
  EXPECT_STREQ(message.parse(bad.bytes(), known), "return without a reply serial");
}

TEST(QVBusMessage, RefusesTypeZeroAndSerialZero) {
  EXPECT_EQ(faultOf(QVTestMessage{.type = 0}.bytes()), "message of type 0");
  EXPECT_EQ(faultOf(QVTestMessage{.serial = 0}.bytes()), "message without a serial");
}

TEST(QVBusMessage, TakesTypesAndFieldsThatAreNotDefinedYet) {
  EXPECT_EQ(faultOf(QVTestMessage{.type = 200, .path = ""}.bytes()), "");
  EXPECT_EQ(faultOf(QVTestMessage{.flags = 0xf0}.bytes()), "");
  const auto unknown = QVTestWire().u8(99).signature("a(sv)").array(
      8, [](QVTestWire& wire) { wire.align(8).string("x").signature("u").u32(1); });
  EXPECT_EQ(faultOf(QVTestMessage{.moreFields = unknown.bytes}.bytes()), "");
}

TEST(QVBusMessage, ChecksFieldsThatItDoesNotKnow) {
  const auto broken = QVTestWire().u8(99).signature("b").u32(2).bytes;
  EXPECT_EQ(faultOf(QVTestMessage{.moreFields = broken}.bytes()), "a boolean is neither 0 nor 1");
  const auto twoTypes = QVTestWire().u8(99).signature("uu").u32(2).u32(2).bytes;
  EXPECT_EQ(faultOf(QVTestMessage{.moreFields = twoTypes}.bytes()),
            "a variant's signature is not one complete type");
}

TEST(QVBusMessage, RefusesFieldsThatBreakTheRules) {
  EXPECT_EQ(faultOf(QVTestMessage{.moreFields = field(0, "s", "x")}.bytes()), "header field 0");
  EXPECT_EQ(faultOf(QVTestMessage{.moreFields = field(7, "o", "/x")}.bytes()),
            "header field of the wrong type");
  EXPECT_EQ(faultOf(QVTestMessage{.moreFields = field(7, "ss", "x")}.bytes()),
            "header field of the wrong type");
  EXPECT_EQ(faultOf(QVTestMessage{.moreFields = field(3, "s", "Again")}.bytes()),
            "header field given twice");
  EXPECT_EQ(faultOf(QVTestMessage{.moreFields = numberField(9, 1)}.bytes()),
            "message with file descriptors");
  EXPECT_EQ(faultOf(QVTestMessage{.moreFields = numberField(9, 0)}.bytes()), "");
  EXPECT_EQ(faultOf(QVTestMessage{.moreFields = numberField(5, 0)}.bytes()), "reply to serial 0");
}

TEST(QVBusMessage, RefusesNamesThatBreakTheRules) {
  EXPECT_EQ(faultOf(QVTestMessage{.path = "nopath"}.bytes()), "not an object path");
  EXPECT_EQ(faultOf(QVTestMessage{.path = "/a/"}.bytes()), "not an object path");
  EXPECT_EQ(faultOf(QVTestMessage{.interface = "nodot"}.bytes()), "not an interface name");
  EXPECT_EQ(faultOf(QVTestMessage{.member = "9x"}.bytes()), "not a member name");
  EXPECT_EQ(faultOf(QVTestMessage{.destination = "x"}.bytes()), "not a bus name as destination");
  EXPECT_EQ(faultOf(QVTestMessage{.moreFields = field(7, "s", "x")}.bytes()),
            "not a bus name as sender");
  EXPECT_EQ(faultOf(QVTestMessage{.moreFields = field(4, "s", "x")}.bytes()), "not an error name");
  EXPECT_EQ(faultOf(QVTestMessage{.path = "", .moreFields = field(1, "o", "")}.bytes()),
            "not an object path");
  EXPECT_EQ(faultOf(QVTestMessage{.interface = "", .moreFields = field(2, "s", "")}.bytes()),
            "not an interface name");
  EXPECT_EQ(faultOf(QVTestMessage{.member = "a\xff"}.bytes()), "a string is not UTF-8 without NUL");
}

TEST(QVBusMessage, RefusesWhatIsForLocalUse) {
  EXPECT_EQ(faultOf(QVTestMessage{.path = "/org/freedesktop/DBus/Local"}.bytes()),
            "message for local use only");
  EXPECT_EQ(faultOf(QVTestMessage{.interface = "org.freedesktop.DBus.Local"}.bytes()),
            "message for local use only");
}

TEST(QVBusMessage, WantsTheFieldsOfEachType) {
  EXPECT_EQ(faultOf(QVTestMessage{.path = ""}.bytes()), "call without path or member");
  EXPECT_EQ(faultOf(QVTestMessage{.member = ""}.bytes()), "call without path or member");
  EXPECT_EQ(faultOf(QVTestMessage{.interface = ""}.bytes()), "");
  EXPECT_EQ(faultOf(QVTestMessage{.type = 2}.bytes()), "return without a reply serial");
  EXPECT_EQ(faultOf(bare(2, numberField(5, 1)).bytes()), "");
  EXPECT_EQ(faultOf(bare(3, numberField(5, 1)).bytes()),
            "error without reply serial or error name");
  EXPECT_EQ(faultOf(bare(3, field(4, "s", "a.b")).bytes()),
            "error without reply serial or error name");
  EXPECT_EQ(faultOf(QVTestMessage{.type = 4}.bytes()), "");
  EXPECT_EQ(faultOf(QVTestMessage{.type = 4, .interface = ""}.bytes()),
            "signal without path, interface or member");
}

TEST(QVBusMessage, RefusesAHeaderWithWrongLengthsOrPadding) {
  // The padding between the fields and the body.
  auto bytes = QVTestMessage{.member = "Ab"}.bytes();
  ASSERT_EQ(bytes.back(), '\0');
  bytes.back() = 1;
  EXPECT_EQ(faultOf(bytes), "padding is not zero");

  // The fields' length one short: the last field reaches over it.
  bytes = QVTestMessage{.signature = "x", .body = "12345678"}.bytes();
  const auto fields = static_cast<uint32_t>(static_cast<unsigned char>(bytes[12]));
  QVTestWire wire;
  wire.bytes = bytes;
  wire.setNumber(12, fields - 1);
  EXPECT_NE(faultOf(wire.bytes), "");

  // A field's string that reaches over the header's end.
  bytes = QVTestMessage{}.bytes();
  wire.bytes = bytes;
  wire.setNumber(20, 100000);
  EXPECT_EQ(faultOf(wire.bytes), "truncated");
}

TEST(QVBusMessage, ChecksBodiesOfAnySignature) {
  const auto faultOfBody = [](const std::string& signature, const std::string& body) {
    const auto bytes = QVTestMessage{.signature = signature, .body = body}.bytes();
    QVBusMessage message;
    EXPECT_EQ(message.parse(bytes), nullptr);
    const char* reason = message.checkBody();
    return std::string(reason == nullptr ? "" : reason);
  };
  EXPECT_EQ(faultOfBody("z", "1234"), "not a signature");
  EXPECT_EQ(faultOfBody("u", "12345"), "body longer than its signature");
  EXPECT_EQ(faultOfBody("u", "123"), "truncated");
  EXPECT_EQ(faultOfBody("u", ""), "truncated");
  EXPECT_EQ(faultOfBody("u", "1234"), "");
  EXPECT_EQ(faultOfBody("", ""), "");
  EXPECT_EQ(faultOfBody("h", "1234"), "");
  EXPECT_EQ(faultOfBody("yu", "1\0\0\0001234"s), "");
  EXPECT_EQ(faultOfBody("yu", "1\0\1\0001234"s), "padding is not zero");
}
