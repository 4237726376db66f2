#include "QVServices/Statistics/Service/QVReportingKnownTexts.h"
#include "QVServices/Statistics/Service/QVReportingPayloadCoding.h"
#include "QVServices/Statistics/Service/QVReportingPayloadStore.h"
#include "platform/QVText.h"
#include "tests/unit/core/QVPayloadReading.h"

#include <bit>
#include <cmath>
#include <cstdint>
#include <limits>
#include <string>
#include <vector>

#include <gmock/gmock.h>

namespace {

constexpr double kInfinity = std::numeric_limits<double>::infinity();

QVValue roundTrip(const QVValue& value) {
  std::string bytes;
  QVReportingKnownTexts known;
  QVReportingEncodeValue(bytes, value, known);
  QVReportingPayloadDecoder decoder(reinterpret_cast<const uint8_t*>(bytes.data()));
  QVValue decoded = decoder.value();
  return QVValue(decoded);  // a copy: what was decoded borrows the bytes
}

std::size_t encodedBytes(const QVValue& value) {
  std::string bytes;
  QVReportingKnownTexts known;
  QVReportingEncodeValue(bytes, value, known);
  return bytes.size();
}

TEST(QVReportingPayloadCoding, KeepsEveryKindOfValue) {
  const std::vector<QVValue> values{
      QVValue(),
      false,
      true,
      "",
      "text",
      std::string(5000, 'x'),
      std::string_view("a\0b", 3),
      QVArray(),
      QVArray{1, "two", QVArray{3.5, QVDictionary{{"four", QVValue()}}}},
      QVDictionary(),
      QVDictionary{{"", 1}, {"nested key", QVDictionary{{"x", QVArray{true}}}}}};
  for (const QVValue& value : values) EXPECT_EQ(roundTrip(value), value) << QVText(value);
}

TEST(QVReportingPayloadCoding, KeepsIntegersOfEverySize) {
  std::vector<int64_t> integers{0, 1, -1, 239, 240, -240, INT64_MAX, INT64_MIN, INT64_MIN + 1};
  for (int shift = 0; shift < 63; ++shift) {
    for (const int64_t delta : {-1, 0, 1}) {
      integers.push_back((int64_t{1} << shift) + delta);
      integers.push_back(-(int64_t{1} << shift) + delta);
    }
  }
  for (const int64_t integer : integers) EXPECT_EQ(roundTrip(integer), QVValue(integer));
  for (const uint64_t natural : {uint64_t{INT64_MAX} + 1, UINT64_MAX - 1, UINT64_MAX}) {
    EXPECT_EQ(roundTrip(natural), QVValue(natural));
  }
}

TEST(QVReportingPayloadCoding, KeepsDoublesToTheBit) {
  std::vector<double> reals{0.0, -0.0, 0.5, 0.1, 1e300, -1e300, 5e-324, 12.5, kInfinity, -kInfinity,
                            std::nan(""), -std::nan(""),
                            // NaNs with payloads of their own, quiet and signalling.
                            std::bit_cast<double>(uint64_t{0x7FF8000000000001}),
                            std::bit_cast<double>(uint64_t{0x7FF0000000000001}),
                            std::numeric_limits<float>::max(), std::numeric_limits<double>::max(),
                            std::numeric_limits<float>::denorm_min()};
  for (const double real : reals) {
    const QVValue decoded = roundTrip(real);
    ASSERT_EQ(decoded.kind(), QVValue::Kind::real);
    EXPECT_EQ(std::bit_cast<uint64_t>(decoded.real()), std::bit_cast<uint64_t>(real)) << real;
  }
}

TEST(QVReportingPayloadCoding, TakesFewBytesForUsualValues) {
  EXPECT_EQ(encodedBytes(0), 1u);
  EXPECT_EQ(encodedBytes(239), 1u);
  EXPECT_EQ(encodedBytes(240), 3u);
  EXPECT_EQ(encodedBytes(48000), 4u);
  EXPECT_EQ(encodedBytes(true), 1u);
  EXPECT_EQ(encodedBytes(0.5), 5u);
  EXPECT_EQ(encodedBytes(0.1), 9u);
  EXPECT_EQ(encodedBytes("text"), 6u);
  EXPECT_EQ(encodedBytes(std::string(200, 'x')), 9u) << "once it is known";
}

TEST(QVReportingPayloadCoding, KeepsNumbersAndTexts) {
  for (const uint64_t number :
       {uint64_t{0}, uint64_t{127}, uint64_t{128}, uint64_t{16383}, uint64_t{16384}, UINT64_MAX}) {
    std::string bytes;
    QVReportingEncodeNumber(bytes, number);
    QVReportingEncodeText(bytes, "after");
    QVReportingPayloadDecoder decoder(reinterpret_cast<const uint8_t*>(bytes.data()));
    EXPECT_EQ(decoder.number(), number);
    EXPECT_EQ(decoder.text(), "after");
  }
}

// A message as clients send them: ten entries, about 250 bytes of keys and values.
QVDictionary typicalMessage(int number) {
  return {{"processing_time_avg_us", 118.25},
          {"processing_time_max_us", 1450 + number % 97},
          {"buffer_fill_frames", 2048 - number % 512},
          {"qvreporting_timestamp", 1.7041646e9 + number},
          {"xrun_count", number % 3},
          {"sample_rate_hz", 48000},
          {"playback_position_ms", 1000 * number},
          {"active_route", "BuiltInSpeaker"},
          {"is_now_playing", true},
          {"audio_queue_identifier", "queue-17"}};
}

std::size_t contentBytes(const QVDictionary& message) {
  std::size_t bytes = 0;
  for (const auto& [key, value] : message) {
    bytes += key.size() + (value.isString() ? value.string().size() : sizeof(int64_t));
  }
  return bytes;
}

TEST(QVReportingPayloadStore, GivesPayloadsBack) {
  QVReportingPayloadStore store;
  const QVDictionary nested{{"a", QVDictionary{{"deep", QVArray{1, "x"}}}}, {"b", UINT64_MAX}};
  const auto first = store.append({{"a", 1}});
  const auto second = store.append(nested);
  const auto third = store.append({});
  const auto fourth = store.append({{"a", 2}});
  EXPECT_EQ(payloadAt(store, first), (QVDictionary{{"a", 1}}));
  EXPECT_EQ(payloadAt(store, second), nested);
  EXPECT_TRUE(payloadAt(store, third).empty());
  EXPECT_EQ(payloadAt(store, fourth), (QVDictionary{{"a", 2}}));
}

TEST(QVReportingPayloadStore, GivesPayloadsWhoseCopiesOutliveIt) {
  QVDictionary payload;
  {
    QVReportingPayloadStore store;
    payload = payloadAt(store, store.append({{"key", "characters in the store"}}));
  }
  EXPECT_EQ(payload, (QVDictionary{{"key", "characters in the store"}}));
}

TEST(QVReportingPayloadStore, NumbersSetsOfKeys) {
  QVReportingPayloadStore store;
  std::vector<QVDictionaryEntry> room;
  const auto keySetOf = [&](const QVDictionary& payload) {
    return store.read(store.append(payload), room).keySet;
  };
  const uint64_t one = keySetOf({{"a", 1}});
  const uint64_t two = keySetOf({{"a", 1}, {"b", 2}});
  EXPECT_NE(one, 0u);
  EXPECT_NE(two, one);
  EXPECT_EQ(keySetOf({{"a", "another value"}}), one);
  EXPECT_EQ(keySetOf({{"a", 3}, {"b", 4}}), two);
}

TEST(QVReportingPayloadStore, ReadsOnePayloadAfterTheOtherIntoTheSameRoom) {
  QVReportingPayloadStore store;
  const auto large = store.append({{"a", QVArray{1}}, {"b", "two"}, {"c", 3}});
  const auto small = store.append({{"z", 26}});
  const auto empty = store.append({});
  std::vector<QVDictionaryEntry> room;
  EXPECT_EQ(store.read(large, room).entries.size(), 3u);
  EXPECT_EQ(dictionaryOf(store.read(small, room)), (QVDictionary{{"z", 26}}));
  EXPECT_TRUE(store.read(empty, room).entries.empty());
  EXPECT_EQ(dictionaryOf(store.read(large, room)),
            (QVDictionary{{"a", QVArray{1}}, {"b", "two"}, {"c", 3}}));
}

TEST(QVReportingPayloadStore, KeepsInternedTextsInTheirPlaces) {
  QVReportingPayloadStore store;
  const std::string_view first = store.interned(store.intern("first"));
  for (int i = 0; i < 1000; ++i) store.intern(QVText("text ", i));
  EXPECT_EQ(first, "first");
  EXPECT_EQ(store.interned(store.intern("first")).data(), first.data());
  EXPECT_EQ(store.interned(store.intern("text 999")), "text 999");
}

TEST(QVReportingPayloadStore, GivesManyPayloadsOfManyKindsBack) {
  QVReportingPayloadStore store;
  std::vector<QVReportingPayloadStore::Position> positions;
  const auto message = [](int number) {
    // Three sets of keys in turn, and from time to time a text larger than any chunk.
    const std::string text(number % 500 == 0 ? 100'000 : static_cast<std::size_t>(number % 40),
                           'x');
    return QVDictionary{{number % 3 == 0   ? "a"
                         : number % 3 == 1 ? "b"
                                           : "c",
                         number},
                        {"text", text}};
  };
  for (int number = 0; number < 3000; ++number) positions.push_back(store.append(message(number)));
  for (int number = 0; number < 3000; ++number) {
    ASSERT_EQ(payloadAt(store, positions[static_cast<std::size_t>(number)]), message(number))
        << number;
  }
}

TEST(QVReportingPayloadStore, WritesKeysOutBeyondTheSetsThatItRemembers) {
  constexpr int kRememberedSets = 4096;
  constexpr int kSets = kRememberedSets + 500;
  constexpr std::size_t kKeyBytes = 100;
  QVReportingPayloadStore store;
  std::vector<QVReportingPayloadStore::Position> positions;
  const auto message = [](int number) {
    return QVDictionary{{QVText(std::string(kKeyBytes, 'k'), number), number}, {"common", "x"}};
  };
  for (int number = 0; number < kSets; ++number) {
    if (number == kRememberedSets) {
      EXPECT_LT(store.footprint(), kRememberedSets * kKeyBytes / 4) << "keys lie elsewhere";
    }
    positions.push_back(store.append(message(number)));
  }
  EXPECT_GT(store.footprint(), (kSets - kRememberedSets) * kKeyBytes) << "keys lie here";
  for (int number = 0; number < kSets; ++number) {
    ASSERT_EQ(payloadAt(store, positions[static_cast<std::size_t>(number)]), message(number));
  }
}

TEST(QVReportingPayloadStore, RemembersNoMoreThanAMebibyteOfKeys) {
  constexpr std::size_t kKeyBytes = 100'000;
  constexpr int kSets = 40;
  QVReportingPayloadStore store;
  std::vector<QVReportingPayloadStore::Position> positions;
  const auto message = [](int number) {
    return QVDictionary{{QVText(std::string(kKeyBytes, 'k'), number), number}};
  };
  for (int number = 0; number < kSets; ++number) positions.push_back(store.append(message(number)));
  EXPECT_GT(store.footprint(), (kSets - 11) * kKeyBytes) << "ten of them are remembered";
  for (int number = 0; number < kSets; ++number) {
    ASSERT_EQ(payloadAt(store, positions[static_cast<std::size_t>(number)]), message(number));
  }
}

TEST(QVReportingPayloadStore, KeepsTextsThatComeAgainOnce) {
  constexpr int kMessages = 1000;
  constexpr std::size_t kTextBytes = 200;
  QVReportingPayloadStore store;
  const auto message = [](int number) {
    return QVDictionary{{"devices", QVArray{QVText(number % 7, std::string(kTextBytes, 'd'))}},
                        {"number", number},
                        {"route", QVText(number % 10, std::string(kTextBytes, 'r'))}};
  };
  std::vector<QVReportingPayloadStore::Position> positions;
  for (int number = 0; number < kMessages; ++number)
    positions.push_back(store.append(message(number)));
  EXPECT_LT(store.footprint(), kMessages * kTextBytes / 4);
  for (int number = 0; number < kMessages; ++number) {
    ASSERT_EQ(payloadAt(store, positions[static_cast<std::size_t>(number)]), message(number));
  }
}

TEST(QVReportingPayloadStore, WritesTextsOutBeyondThoseThatItKnows) {
  constexpr int kMessages = 3000;
  QVReportingPayloadStore store;
  const auto message = [](int number) {
    return QVDictionary{{"title", QVText("A title that comes but once: ", number)}};
  };
  std::vector<QVReportingPayloadStore::Position> positions;
  for (int number = 0; number < kMessages; ++number)
    positions.push_back(store.append(message(number)));
  for (int number = 0; number < kMessages; ++number) {
    ASSERT_EQ(payloadAt(store, positions[static_cast<std::size_t>(number)]), message(number));
  }
}

TEST(QVReportingPayloadStore, TakesOfALargePayloadNoMoreThanItsSize) {
  constexpr std::size_t kBytes = 10'000'000;
  QVReportingPayloadStore store;
  store.append({{"text", std::string(kBytes, 'x')}});
  EXPECT_LT(store.footprint(), kBytes + 1000);
}

TEST(QVReportingPayloadStore, TakesOfManySmallValuesWhatTheyTakeEncoded) {
  constexpr std::size_t kValues = 100'000;
  const std::vector<QVValue> values(kValues, QVValue(7));
  QVReportingPayloadStore store;
  const auto position = store.append({{"values", QVArray::assemble(values)}});
  EXPECT_LT(store.footprint(), kValues + kValues / 4);
  EXPECT_EQ(payloadAt(store, position), (QVDictionary{{"values", QVArray::assemble(values)}}));
}

TEST(QVReportingPayloadStore, KeepsWhatWasReadWhereItIs) {
  QVReportingPayloadStore store;
  const std::string longKey(100'000, 'k');
  const std::string longText(100'000, 't');
  const auto small = store.append({{longKey, "small"}});
  const auto large = store.append({{"text", longText}});
  std::vector<QVDictionaryEntry> smallRoom;
  std::vector<QVDictionaryEntry> largeRoom;
  const auto smallRead = store.read(small, smallRoom);
  const auto largeRead = store.read(large, largeRoom);
  for (int number = 0; number < 100; ++number) store.append({{longKey, "x"}, {"text", longText}});
  EXPECT_EQ(dictionaryOf(smallRead), (QVDictionary{{longKey, "small"}}));
  EXPECT_EQ(dictionaryOf(largeRead), (QVDictionary{{"text", longText}}));
}

TEST(QVReportingPayloadStore, StaysSmallForASingleMessage) {
  QVReportingPayloadStore store;
  EXPECT_LT(store.footprint(), 32u);
  store.append({{"a", 1}});
  EXPECT_LT(store.footprint(), 600u);
}

TEST(QVReportingPayloadStore, TakesLittleForATypicalMessage) {
  // Both arrays of a session hold an entry of 16 bytes for a message; its payload lies here once.
  constexpr std::size_t kEntries = 2 * 16;
  constexpr std::size_t kMost = 120;
  constexpr int kMessages = 20'000;
  EXPECT_GE(contentBytes(typicalMessage(1)), 240u);
  QVReportingPayloadStore store;
  for (int number = 0; number < kMessages; ++number) store.append(typicalMessage(number));
  const std::size_t perMessage = store.footprint() / kMessages + kEntries;
  EXPECT_LE(perMessage, kMost);
  RecordProperty("bytes_per_message", static_cast<int>(perMessage));
}

TEST(QVReportingPayloadStore, InternsTexts) {
  QVReportingPayloadStore store;
  const uint32_t first = store.intern("Session_Playback_Start");
  const uint32_t second = store.intern("Session_Playback_Stop");
  EXPECT_NE(first, second);
  EXPECT_EQ(store.intern("Session_Playback_Start"), first);
  EXPECT_EQ(store.interned(first), "Session_Playback_Start");
  EXPECT_EQ(store.interned(second), "Session_Playback_Stop");
}

TEST(QVReportingPayloadStore, RefusesWhatComesAfterItsMaximumAndSaysSoOnce) {
  int told = 0;
  QVReportingPayloadStore store(2000, [&told] { ++told; });
  std::vector<QVReportingPayloadStore::Position> positions;
  while (const auto position = store.appendIfNotFull({{"n", int64_t(positions.size())}})) {
    positions.push_back(*position);
  }
  EXPECT_EQ(told, 1);
  // 512 bytes, and 32 for each payload's entries in the arrays.
  EXPECT_EQ(positions.size(), (2000u - 512u + 31u) / 32u);
  EXPECT_EQ(store.appendIfNotFull({}), std::nullopt);
  EXPECT_EQ(told, 1);
  EXPECT_EQ(payloadAt(store, store.append({{"n", -1}})), (QVDictionary{{"n", -1}}))
      << "what does not ask for the maximum";
  EXPECT_EQ(payloadAt(store, positions.back()),
            (QVDictionary{{"n", int64_t(positions.size()) - 1}}));
}

TEST(QVReportingPayloadStore, CountsATextAsOftenAsItComesAgainstItsMaximum) {
  constexpr std::size_t kMaximum = 100'000;
  constexpr std::size_t kTextBytes = 250;
  QVReportingPayloadStore store(kMaximum);
  std::size_t taken = 0;
  while (store.appendIfNotFull({{"text", std::string(kTextBytes, 'x')}})) ++taken;
  EXPECT_LE(taken, kMaximum / kTextBytes);
  EXPECT_GE(taken, kMaximum / (kTextBytes + 100));
}

TEST(QVReportingPayloadStore, KeepsThePayloadWholeThatReachesItsMaximum) {
  QVReportingPayloadStore store(2000);
  const QVDictionary large{{"text", std::string(5000, 'x')}};
  const auto position = store.appendIfNotFull(large);
  ASSERT_TRUE(position);
  EXPECT_EQ(payloadAt(store, *position), large);
  EXPECT_EQ(store.appendIfNotFull({{"n", 1}}), std::nullopt) << "nobody need be told";
}

}  // namespace
