#include "QVServices/Statistics/Service/QVReportingPayloads.h"
#include "platform/fake/QVFakeMemoryCharge.h"

#include <string>
#include <vector>

#include <gmock/gmock.h>

namespace {

TEST(QVReportingNormalisedPayload, ReplacesEveryBlankInKeys) {
  EXPECT_EQ(QVReportingNormalisedPayload(
                {{"buffer size", 512}, {" a  b ", 1}, {"plain", 2}, {" ", 3}, {"", 4}}),
            (QVDictionary{{"buffer_size", 512}, {"_a__b_", 1}, {"plain", 2}, {"_", 3}, {"", 4}}));
}

TEST(QVReportingNormalisedPayload, ReplacesNothingButBlanks) {
  const QVDictionary message{{"tab\there", 1}, {"line\nbreak", 2}, {"no\u00A0break", 3}};
  EXPECT_EQ(QVReportingNormalisedPayload(message), message);
}

TEST(QVReportingNormalisedPayload, LeavesValuesAndNestedKeysAsTheyAre) {
  EXPECT_EQ(QVReportingNormalisedPayload({{"a b", "text with blanks"},
                                          {"c d", QVDictionary{{"inner key", QVArray{"x y"}}}}}),
            (QVDictionary{{"a_b", "text with blanks"},
                          {"c_d", QVDictionary{{"inner key", QVArray{"x y"}}}}}));
}

TEST(QVReportingNormalisedPayload, IsTheMessageItselfWhereNoKeyHasABlank) {
  const QVDictionary message{{"a", "with blank"}, {"b", 2}};
  EXPECT_TRUE(QVReportingNormalisedPayload(message).sharesContentsWith(message));
  EXPECT_TRUE(QVReportingNormalisedPayload(QVDictionary()).isAbsent());
}

TEST(QVReportingNormalisedPayload, LetsTheKeyThatAlreadyHasAnUnderscoreWin) {
  EXPECT_EQ(QVReportingNormalisedPayload({{"a_b", "underscore"}, {"a b", "blank"}}),
            (QVDictionary{{"a_b", "underscore"}}));
  EXPECT_EQ(QVReportingNormalisedPayload({{"a b c", 1}, {"a b_c", 2}, {"a_b c", 3}}),
            (QVDictionary{{"a_b_c", 3}}))
      << "the last in order of those that collide";
}

TEST(QVReportingNormalisedPayload, SortsTheNewKeys) {
  // '!' lies between the blank and '_': the order of these two keys is reversed.
  const QVDictionary payload = QVReportingNormalisedPayload({{"a b", 1}, {"a!b", 2}});
  ASSERT_EQ(payload.size(), 2u);
  EXPECT_EQ(payload.begin()[0].key, "a!b");
  EXPECT_EQ(payload.begin()[1].key, "a_b");
  EXPECT_EQ(*payload.find("a_b"), QVValue(1));
}

TEST(QVReportingNormalisedPayload, HandlesManyKeys) {
  std::vector<std::string> keys;
  for (int i = 0; i < 100; ++i) keys.push_back("key " + std::to_string(i));
  std::vector<QVDictionaryEntry> entries;
  for (const auto& key : keys) entries.push_back({key, key});
  const QVDictionary payload = QVReportingNormalisedPayload(QVDictionary::assemble(entries));
  ASSERT_EQ(payload.size(), 100u);
  for (int i = 0; i < 100; ++i) {
    EXPECT_EQ(*payload.find("key_" + std::to_string(i)), QVValue("key " + std::to_string(i)));
  }
}

TEST(QVReportingNormalisedPayload, IsChargedToWhomTheMessageIs) {
  QVFakeMemoryCharge charge;
  {
    std::vector<QVDictionaryEntry> entries{{"a b", "text"}};
    const QVDictionary message = QVDictionary::assemble(entries, &charge);
    const QVDictionary payload = QVReportingNormalisedPayload(message);
    EXPECT_EQ(charge.held(), message.footprint() + payload.footprint());
  }
  EXPECT_EQ(charge.held(), 0u);
}

}  // namespace
