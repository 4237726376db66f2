#include "platform/linux/bus/QVBusFrameDecoder.h"
#include "platform/linux/bus/QVBusProtocol.h"
#include "tests/support/QVTestMessage.h"

#include <string>
#include <string_view>
#include <vector>

#include <gtest/gtest.h>

namespace {

using Result = QVBusFrameDecoder::Result;

// Feeds the pieces one after the other and answers the messages that come out.
std::vector<std::string> decode(QVBusFrameDecoder& decoder,
                                const std::vector<std::string_view>& pieces) {
  std::vector<std::string> messages;
  for (const auto piece : pieces) {
    // A copy that goes right after, so that views that outlive their bytes show.
    const std::string bytes(piece);
    decoder.feed(bytes);
    std::string_view message;
    while (decoder.next(message) == Result::message) messages.emplace_back(message);
  }
  return messages;
}

// The fixed part of a header that announces these lengths.
std::string announcing(uint32_t fields, uint32_t body, char order = 'l') {
  QVTestWire wire(order);
  wire.u8(static_cast<uint8_t>(order)).u8(1).u8(0).u8(1).u32(body).u32(1).u32(fields);
  return wire.bytes;
}

}  // namespace

TEST(QVBusFrameDecoder, HandsOutWhatIsWholeWhereItLies) {
  const auto bytes = QVTestCall("CreateReportingSession", 1) + QVTestCall("GetAllReporters", 2, 2);
  QVBusFrameDecoder decoder;
  decoder.feed(bytes);
  std::string_view first, second, none;
  ASSERT_EQ(decoder.next(first), Result::message);
  ASSERT_EQ(decoder.next(second), Result::message);
  EXPECT_EQ(decoder.next(none), Result::needsMore);
  EXPECT_EQ(first.data(), bytes.data());
  EXPECT_EQ(second.data(), bytes.data() + first.size());
  EXPECT_EQ(first.size() + second.size(), bytes.size());
  EXPECT_LE(decoder.bytesHeld(), std::string().capacity());
}

TEST(QVBusFrameDecoder, GivesTheSameMessagesWhereverTheStreamIsCut) {
  for (const char order : {'l', 'B'}) {
    const auto first = QVTestCall("CreateReportingSession", 1, 1, order);
    const auto second = QVTestMessage{.order = order, .serial = 2, .member = "X"}.bytes();
    const auto third = QVTestCall("StopReportingSessionForID", 3, 3, order);
    const std::string all = first + second + third;
    const std::vector<std::string> expected{first, second, third};
    for (std::size_t cut = 0; cut <= all.size(); ++cut) {
      for (std::size_t other : {cut, std::min(cut + 7, all.size()), all.size()}) {
        QVBusFrameDecoder decoder;
        const std::string_view view(all);
        EXPECT_EQ(decode(decoder,
                         {view.substr(0, cut), view.substr(cut, other - cut), view.substr(other)}),
                  expected)
            << cut << " " << other;
      }
    }
  }
}

TEST(QVBusFrameDecoder, TakesBytesOneByOneAndHoldsNothingAfterwards) {
  const auto all =
      QVTestCall("CreateReportingSession", 1) + QVTestCall("CreateReportingSession", 2);
  QVBusFrameDecoder decoder;
  std::vector<std::string_view> pieces;
  for (std::size_t i = 0; i < all.size(); ++i) pieces.push_back(std::string_view(all).substr(i, 1));
  EXPECT_EQ(decode(decoder, pieces).size(), 2U);
  EXPECT_LE(decoder.bytesHeld(), std::string().capacity());
}

TEST(QVBusFrameDecoder, RefusesGarbageAtOnce) {
  std::string_view message;
  for (const auto& bytes : {std::string(16, '\0'), std::string("GET / HTTP/1.1\r\n\r\n"),
                            announcing(8, 0).replace(3, 1, "\2")}) {
    QVBusFrameDecoder decoder;
    decoder.feed(bytes);
    EXPECT_EQ(decoder.next(message), Result::malformed);
    EXPECT_NE(decoder.failure(), nullptr);
    decoder.feed(QVTestCall("CreateReportingSession", 1));
    EXPECT_EQ(decoder.next(message), Result::malformed) << "malformed for good";
  }
}

TEST(QVBusFrameDecoder, RefusesMoreThanEightMebibytesWithoutWaitingForThem) {
  constexpr uint32_t kMost = kBusMaximumMessageBytes;
  std::string_view message;
  for (const char order : {'l', 'B'}) {
    for (const auto& bytes :
         {announcing(0, kMost - 16 + 1, order), announcing(kMost - 16 + 1, 0, order),
          announcing(kMost / 2, kMost / 2, order), announcing(UINT32_MAX, UINT32_MAX, order),
          announcing(0, UINT32_MAX, order)}) {
      QVBusFrameDecoder decoder;
      decoder.feed(bytes);
      EXPECT_EQ(decoder.next(message), Result::malformed);
    }
  }
}

TEST(QVBusFrameDecoder, TakesExactlyEightMebibytes) {
  auto bytes = announcing(0, kBusMaximumMessageBytes - 16);
  bytes.resize(kBusMaximumMessageBytes);
  QVBusFrameDecoder decoder;
  std::vector<std::string_view> pieces;
  for (std::size_t at = 0; at < bytes.size(); at += 65536) {
    pieces.push_back(std::string_view(bytes).substr(at, 65536));
  }
  const auto messages = decode(decoder, pieces);
  ASSERT_EQ(messages.size(), 1U);
  EXPECT_EQ(messages[0], bytes);
}

TEST(QVBusFrameDecoder, GrowsWithWhatCameNotWithWhatIsAnnounced) {
  QVBusFrameDecoder decoder;
  EXPECT_TRUE(decode(decoder, {announcing(0, kBusMaximumMessageBytes - 16)}).empty());
  EXPECT_LT(decoder.bytesHeld(), 100U);
  EXPECT_TRUE(decode(decoder, {std::string(1000, 'x')}).empty());
  EXPECT_LT(decoder.bytesHeld(), 4096U);
}
