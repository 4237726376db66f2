// Messages that break the protocol. Each costs its sender the connection and nobody else anything,
// and one log line says which rule it broke.

#include "tests/support/QVEndToEndTest.h"
#include "tests/support/QVTestMessage.h"

#include <ostream>

#include <gmock/gmock.h>

namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

// The bytes of one dictionary entry: a key and a variant of a value that begins at a multiple of
// `alignment`.
std::string entry(const std::string& key, const std::string& type, std::size_t alignment,
                  const std::string& value) {
  return QVTestWire().string(key).signature(type).align(alignment).raw(value).bytes;
}

// A SendMessage with that body.
std::string messageOf(const std::string& body, uint32_t serial = 1, char order = 'l') {
  return QVTestMessage{.order = order,
                       .serial = serial,
                       .member = "SendMessage",
                       .signature = "a{sv}uqbax",
                       .body = body}
      .bytes();
}

// The body of a SendMessage to session 7, its dictionary's entries given as bytes.
std::string bodyOf(const std::string& entries, bool everySession = false, char order = 'l') {
  return QVTestWire(order)
      .array(8, [&entries](QVTestWire& wire) { wire.raw(entries); })
      .u32(0x08000003)
      .u16(1)
      .u32(everySession ? 1 : 0)
      .array(8, [](QVTestWire& wire) { wire.i64(7); })
      .bytes;
}

std::string message(const std::string& entries, uint32_t serial = 1) {
  return messageOf(bodyOf(entries), serial);
}

// A variant that holds a variant that holds ..., so many of them, and a byte.
std::string nestedVariants(int depth) {
  QVTestWire entry;
  entry.string("deep");
  for (int i = 1; i < depth; ++i) entry.signature("v");
  return entry.signature("y").u8(1).bytes;
}

struct HostileFrame {
  const char* name;
  std::string bytes;
  const char* reason;
};

std::ostream& operator<<(std::ostream& out, const HostileFrame& frame) {
  return out << frame.name;
}

std::vector<HostileFrame> hostileFrames() {
  const std::string sixteen = "l" + std::string("\1\0\1\0\0\0\0\1\0\0\0\0\0\0\0", 15);
  std::string unknownOrder = sixteen;
  unknownOrder[0] = 'x';
  std::string oversized = sixteen;
  oversized[6] = '\x80';  // 8 MiB of body, and a header
  std::string oversizedHeader = sixteen;
  oversizedHeader[15] = '\x7f';
  const std::string badText = "bad \xC3(";
  const auto field = [](uint8_t code, const std::string& type, const std::string& text) {
    return QVTestWire().field(code, type, text).bytes;
  };
  const auto listWith = [](const std::string& fields) {
    return QVTestMessage{.member = "GetAllReporters", .moreFields = fields}.bytes();
  };
  const auto create = [](const std::string& body) {
    return QVTestMessage{.signature = "x", .body = body}.bytes();
  };
  const std::string seven = QVTestWire().i64(7).bytes;

  return {
      // The frame
      {"UnknownByteOrder", unknownOrder, "neither byte order is named"},
      {"OtherVersion", QVTestMessage{.version = 2}.bytes(), "unknown version of the protocol"},
      {"OversizedBodyAnnounced", oversized, "message larger than 8 MiB"},
      {"OversizedHeaderAnnounced", oversizedHeader, "message larger than 8 MiB"},
      // The header
      {"TypeZero", QVTestMessage{.type = 0}.bytes(), "message of type 0"},
      {"SerialZero", QVTestMessage{.serial = 0}.bytes(), "message without a serial"},
      {"NoMember", QVTestMessage{.member = {}}.bytes(), "call without path or member"},
      {"NoPath", QVTestMessage{.path = {}}.bytes(), "call without path or member"},
      {"BadPath", QVTestMessage{.path = "/net//quillon"}.bytes(), "not an object path"},
      {"BadInterface", QVTestMessage{.interface = "nodots"}.bytes(), "not an interface name"},
      {"BadMember", QVTestMessage{.member = "7th"}.bytes(), "not a member name"},
      {"LocalPath", QVTestMessage{.path = "/org/freedesktop/DBus/Local"}.bytes(),
       "message for local use only"},
      {"FieldZero", listWith(field(0, "s", "x")), "header field 0"},
      {"FieldTwice", listWith(field(3, "s", "KillService")), "header field given twice"},
      {"FieldOfWrongType", listWith(field(6, "o", "/a")), "header field of the wrong type"},
      {"BadDestination", listWith(field(6, "s", "a..b")), "not a bus name as destination"},
      {"BadTextInUnknownField", listWith(field(200, "s", badText)),
       "a string is not UTF-8 without NUL"},
      {"Descriptors", listWith(QVTestWire().field(9, 1).bytes), "message with file descriptors"},
      {"ReturnWithoutReplySerial", QVTestMessage{.type = 2}.bytes(),
       "return without a reply serial"},
      // The body
      {"BodyWithoutSignature", QVTestMessage{.body = seven}.bytes(), "body without a signature"},
      {"BodyTooShort", create(seven.substr(0, 4)), "truncated"},
      {"BodyTooLong", create(seven + seven), "body longer than its signature"},
      {"BadSignature", QVTestMessage{.signature = "a{vs}", .body = seven}.bytes(),
       "not a signature"},
      {"ThirtyThreeArrays",
       QVTestMessage{.signature = std::string(33, 'a') + "y", .body = std::string(4, '\0')}.bytes(),
       "not a signature"},
      {"DirtyPadding", messageOf(QVTestWire().u32(8).u32(1).bytes), "padding is not zero"},
      {"BadText", message(entry(badText, "y", 1, "x")), "a string is not UTF-8 without NUL"},
      {"TextWithNul", message(entry(std::string("a\0b", 3), "y", 1, "x")),
       "a string is not UTF-8 without NUL"},
      {"TextWithoutEnd", message(QVTestWire().u32(1).raw("ab").signature("y").raw("\1").bytes),
       "a text is not ended by NUL"},
      {"TextBeyondTheMessage", message(QVTestWire().u32(1'000'000).bytes), "truncated"},
      {"ArrayBeyondTheMessage", messageOf(QVTestWire().u32(1'000'000).align(8).bytes),
       "an array reaches beyond its message"},
      {"HugeArray", messageOf(QVTestWire().u32(0xFFFFFFFF).align(8).bytes),
       "an array larger than 64 MiB"},
      {"NeitherTrueNorFalse", message(entry("abc", "b", 4, {"\2\0\0\0", 4})),
       "a boolean is neither 0 nor 1"},
      {"VariantOfTwoTypes", message(entry("abc", "yy", 1, "xx")),
       "a variant's signature is not one complete type"},
      {"VariantOfNothing", message(entry("abc", "", 1, "")),
       "a variant's signature is not one complete type"},
      // The dictionary's array and entry are the first two.
      {"SixtyThreeVariantsDeep", message(nestedVariants(63)), "containers nested too deeply"},
      {"HundredsOfVariantsDeep", message(nestedVariants(1000)), "containers nested too deeply"},
  };
}

class QVHostileFramesTest : public QVEndToEndTest,
                            public ::testing::WithParamInterface<HostileFrame> {};

TEST_P(QVHostileFramesTest, CostTheConnection) {
  auto witness = connectClient();
  auto peer = connectClient();
  witness.create(7);
  // What came before is carried out, what comes behind is not.
  ASSERT_TRUE(peer.send(createCall(8).bytes(1) + GetParam().bytes + createCall(5555).bytes(3)));
  peer.awaitClose();

  expectLogged("protocol violation, closing the connection of process " +
               std::to_string(::getpid()) + ": " + GetParam().reason);
  expectLogged("InterruptionHandler: connection exited");
  expectLogged("InvalidationHandler: connection exited");
  expectServes(witness);
  expectLogged("deallocing this session 8");
  EXPECT_THAT(witness.reporters(), ElementsAre(7));
  EXPECT_EQ(log().count("protocol violation"), 1U);
  EXPECT_EQ(log().count("created reporting session for ID: 5555"), 0U);
  EXPECT_EQ(log().count("InterruptionHandler: connection exited"), 1U);
  EXPECT_EQ(log().count("InvalidationHandler: connection exited"), 1U);
  endService();
}

INSTANTIATE_TEST_SUITE_P(Rules, QVHostileFramesTest, ::testing::ValuesIn(hostileFrames()),
                         [](const auto& given) { return std::string(given.param.name); });

// ---- What is odd, but allowed

class QVOddFramesTest : public QVEndToEndTest {
 protected:
  void SetUp() override {
    peer_.create(7);
    peer_.start(7);
  }
  void expectStoredPayloads(const std::vector<std::string>& payloads) {
    endService();
    EXPECT_EQ(
        store().rows("SELECT payload FROM beacon_message WHERE category <> 65535 ORDER BY id"),
        payloads);
  }

  QVPeerClient peer_{connectClient()};
};

TEST_F(QVOddFramesTest, BigEndianIsTaken) {
  QVTestWire entries('B');
  entries.entry("frames", "t").u64(0x0102030405060708).entry("note", "s").string("x");
  ASSERT_TRUE(peer_.send(messageOf(bodyOf(entries.bytes, false, 'B'), 100, 'B')));
  EXPECT_TRUE(peer_.awaitReply(100).isReturn());
  expectStoredPayloads({R"({"frames":72623859790382856,"note":"x"})"});
}

TEST_F(QVOddFramesTest, EverySplitOfACallIsTaken) {
  auto witness = connectClient();
  std::vector<std::string> expected;
  std::size_t length = 2;
  for (std::size_t cut = 1; cut < length; ++cut) {
    const int64_t round = static_cast<int64_t>(cut);
    const uint32_t serial = peer_.nextSerial();
    const std::string bytes =
        sendCall({{"round", round}, {"nested", QVArray{"a", 1.5, QVDictionary{{"k", true}}}}}, {7},
                 kSessionPlayback, kStart)
            .bytes(serial);
    length = bytes.size();
    ASSERT_TRUE(peer_.send(bytes.substr(0, cut)));
    // Once this is answered, the first piece has been read.
    witness.call(pingCall());
    ASSERT_TRUE(peer_.send(bytes.substr(cut)));
    ASSERT_TRUE(peer_.awaitReply(serial).isReturn());
    expected.push_back(R"({"nested":["a",1.5,{"k":true}],"round":)" + std::to_string(round) + "}");
  }
  expectStoredPayloads(expected);
}

TEST_F(QVOddFramesTest, ByteAfterByteIsTaken) {
  const std::string bytes = sendCall({{"a", 1}}, {7}, kSessionPlayback, kStart).bytes(100);
  for (const char byte : bytes) ASSERT_TRUE(peer_.send({&byte, 1}));
  EXPECT_TRUE(peer_.awaitReply(100).isReturn());
  expectStoredPayloads({R"({"a":1})"});
}

TEST_F(QVOddFramesTest, ThousandsOfCallsInOneWriteAreTaken) {
  constexpr uint32_t kCalls = 5000;
  std::string batch;
  for (uint32_t i = 0; i < kCalls; ++i) batch += pingCall().bytes(1000 + i);
  batch += listCall().bytes(999);
  ASSERT_TRUE(peer_.send(batch));
  for (uint32_t i = 0; i < kCalls; ++i) {
    const auto reply = peer_.receive();
    ASSERT_TRUE(reply.has_value());
    ASSERT_EQ(reply->replySerial, 1000 + i);
  }
  EXPECT_THAT(peer_.awaitReply(999).integers(), ElementsAre(7));
}

TEST_F(QVOddFramesTest, AMessageOfEightMebibytesIsTaken) {
  constexpr std::size_t kLargest = std::size_t{8} << 20;
  const std::size_t overhead =
      sendCall({{"text", std::string(8, 'x')}}, {7}, kSessionPlayback, kStart).bytes(1).size() - 8;
  const std::string text((kLargest - overhead) & ~std::size_t{7}, 'x');
  EXPECT_TRUE(peer_.call(sendCall({{"text", text}}, {7}, kSessionPlayback, kStart)).isReturn());
  endService();
  EXPECT_EQ(store().number("SELECT length(json_extract(payload, '$.text')) FROM beacon_message "
                           "WHERE category <> 65535"),
            static_cast<int64_t>(text.size()));
}

TEST_F(QVOddFramesTest, SixtyTwoVariantsDeepAreTaken) {
  ASSERT_TRUE(peer_.send(message(nestedVariants(62), 100)));
  EXPECT_TRUE(peer_.awaitReply(100).isReturn());
  expectStoredPayloads({R"({"deep":1})"});
}

TEST_F(QVOddFramesTest, UnknownFieldsTypesAndFlagsAreIgnored) {
  const std::string fields = QVTestWire().field(200, "s", "whatever").bytes;
  ASSERT_TRUE(peer_.send(QVTestMessage{.type = 77, .serial = 100}.bytes()));
  ASSERT_TRUE(peer_.send(
      QVTestMessage{.flags = 0xFE, .serial = 101, .member = "GetAllReporters", .moreFields = fields}
          .bytes()));
  EXPECT_THAT(peer_.awaitReply(101).integers(), ElementsAre(7));
}

TEST_F(QVOddFramesTest, DescriptorsInAMessageAreRefusedAndClosed) {
  // The store's own are open by now.
  expectLogged("List of backends");
  const std::size_t before = service().openDescriptors();
  const std::string entries = entry("abc", "h", 4, std::string(4, '\0'));
  ASSERT_TRUE(peer_.sendWithDescriptor(message(entries, 100), STDIN_FILENO));
  const auto reply = peer_.awaitReply(100);
  EXPECT_EQ(reply.errorName, "org.freedesktop.DBus.Error.InvalidArgs");
  EXPECT_EQ(service().openDescriptors(), before);
  expectServes(peer_);
  expectStoredPayloads({});
}

TEST_F(QVOddFramesTest, EverySessionWithAListIsRefusedBeforeAnythingElse) {
  const std::string entries = entry("abc", "h", 4, std::string(4, '\0'));
  ASSERT_TRUE(peer_.send(messageOf(bodyOf(entries, true), 100)));
  const auto reply = peer_.awaitReply(100);
  EXPECT_EQ(reply.errorName, "org.freedesktop.DBus.Error.InvalidArgs");
  EXPECT_THAT(reply.string(), HasSubstr("every session"));
}

}  // namespace
