#include "platform/QVValue.h"
#include "platform/fake/QVFakeMemoryCharge.h"

#include <algorithm>
#include <cstdint>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

const QVDictionary kEmpty(std::initializer_list<QVDictionaryEntry>{});

std::vector<std::string> keysOf(const QVDictionary& dictionary) {
  std::vector<std::string> keys;
  for (const auto& entry : dictionary) keys.emplace_back(entry.key);
  return keys;
}

TEST(QVDictionary, IteratesInAscendingByteOrderOfTheKey) {
  const QVDictionary dictionary{{"b", 1},   {"B", 2}, {"ä", 3}, {"a b", 4},
                                {"a_b", 5}, {"", 6},  {"a", 7}};
  EXPECT_THAT(keysOf(dictionary), ElementsAre("", "B", "a", "a b", "a_b", "b", "ä"));
}

TEST(QVDictionary, KeepsTheLaterOfEqualKeys) {
  const QVDictionary unsorted{{"b", 1}, {"a", 2}, {"b", 3}, {"a", 4}, {"b", 5}};
  EXPECT_EQ(unsorted, (QVDictionary{{"a", 4}, {"b", 5}}));
  const QVDictionary sorted{{"a", 1}, {"a", 2}, {"b", 3}, {"b", 4}};
  EXPECT_EQ(sorted, (QVDictionary{{"a", 2}, {"b", 4}}));
  EXPECT_EQ((QVDictionary{{"a", 1}, {"a", 2}, {"a", "three"}}), (QVDictionary{{"a", "three"}}));
}

TEST(QVDictionary, SortsManyKeysAlikeAndKeepsTheLater) {
  // More than are sorted by insertion; every key comes twice, the second time with its number.
  constexpr int kKeys = 200;
  std::vector<std::string> keys;
  for (int i = 0; i < kKeys; ++i) keys.push_back(std::to_string((i * 37) % kKeys));
  std::vector<QVDictionaryEntry> entries;
  for (const auto& key : keys) entries.push_back({key, -1});
  for (int i = 0; i < kKeys; ++i) entries.push_back({keys[static_cast<std::size_t>(i)], i});
  const QVDictionary dictionary = QVDictionary::assemble(entries);
  ASSERT_EQ(dictionary.size(), std::size_t{kKeys});
  EXPECT_TRUE(std::ranges::is_sorted(keysOf(dictionary)));
  for (int i = 0; i < kKeys; ++i) {
    EXPECT_EQ(*dictionary.find(keys[static_cast<std::size_t>(i)]), QVValue(i));
  }
}

TEST(QVDictionary, FindsByKey) {
  const QVDictionary dictionary{{"one", 1}, {"two", 2}, {"three", 3}, {"", 0}};
  EXPECT_EQ(*dictionary.find("two"), QVValue(2));
  EXPECT_EQ(*dictionary.find(""), QVValue(0));
  EXPECT_EQ(dictionary.find("four"), nullptr);
  EXPECT_EQ(dictionary.find("tw"), nullptr);
  EXPECT_EQ(dictionary.find("twoo"), nullptr);
  EXPECT_TRUE(dictionary.contains("three"));
  EXPECT_FALSE(dictionary.contains("Three"));
}

TEST(QVDictionary, ReadsAsEmptyWhereItIsAbsent) {
  const QVDictionary absent;
  EXPECT_TRUE(absent.isAbsent());
  EXPECT_TRUE(absent.empty());
  EXPECT_THAT(keysOf(absent), IsEmpty());
  EXPECT_EQ(absent.find("a"), nullptr);
  EXPECT_EQ(absent.footprint(), 0u);
  EXPECT_EQ(absent.charge(), nullptr);
  EXPECT_FALSE(kEmpty.isAbsent());
  EXPECT_TRUE(kEmpty.empty());
  EXPECT_EQ(absent, kEmpty);
  EXPECT_FALSE(absent == (QVDictionary{{"a", 1}}));
}

TEST(QVDictionary, ComparesKeysAndValues) {
  const QVDictionary dictionary{{"a", 1}, {"b", "x"}};
  EXPECT_EQ(dictionary, (QVDictionary{{"b", "x"}, {"a", 1}}));
  EXPECT_FALSE(dictionary == (QVDictionary{{"a", 1}}));
  EXPECT_FALSE(dictionary == (QVDictionary{{"a", 1}, {"b", "y"}}));
  EXPECT_FALSE(dictionary == (QVDictionary{{"a", 1}, {"c", "x"}}));
  EXPECT_FALSE(dictionary == (QVDictionary{{"a", 1.0}, {"b", "x"}}));
}

TEST(QVDictionary, CopiesKeysAndCharactersOutOfItsEntries) {
  QVDictionary dictionary;
  {
    const auto key = std::make_unique<std::string>("a key on its way out, longer than usual");
    const auto text = std::make_unique<std::string>("a text on its way out, longer than usual");
    std::vector<QVDictionaryEntry> entries{{*key, QVValue::borrowing(*text)}};
    dictionary = QVDictionary::assemble(entries);
  }
  EXPECT_EQ(dictionary, (QVDictionary{{"a key on its way out, longer than usual",
                                       "a text on its way out, longer than usual"}}));
}

TEST(QVDictionary, LetsItsValuesOutliveIt) {
  QVValue text;
  QVValue nested;
  {
    const QVDictionary dictionary{{"text", "inside of the block"},
                                  {"nested", QVDictionary{{"deep", "deeper inside"}}}};
    text = *dictionary.find("text");
    nested = *dictionary.find("nested");
  }
  EXPECT_EQ(text.string(), "inside of the block");
  EXPECT_EQ(nested.dictionary(), (QVDictionary{{"deep", "deeper inside"}}));
}

TEST(QVDictionary, SharesContentsBetweenHandles) {
  const QVDictionary dictionary{{"a", 1}};
  const QVDictionary copy = dictionary;  // NOLINT(performance-unnecessary-copy-initialization)
  EXPECT_TRUE(copy.sharesContentsWith(dictionary));
  EXPECT_FALSE(dictionary.sharesContentsWith({{"a", 1}}));
  QVDictionary source = dictionary;
  const QVDictionary moved = std::move(source);
  EXPECT_TRUE(moved.sharesContentsWith(dictionary));
  EXPECT_TRUE(source.isAbsent());  // NOLINT(bugprone-use-after-move): what a move leaves behind
}

TEST(QVDictionary, MergesWithTheOthersEntriesOnTop) {
  const QVDictionary base{{"a", 1}, {"b", "old"}};
  const QVDictionary merged = base.merging({{"b", "new"}, {"c", 3}});
  EXPECT_EQ(merged, (QVDictionary{{"a", 1}, {"b", "new"}, {"c", 3}}));
  EXPECT_EQ(base, (QVDictionary{{"a", 1}, {"b", "old"}})) << "is as it was";
  EXPECT_EQ(base.merging({}), base);
  EXPECT_EQ(QVDictionary().merging(base), base);
  EXPECT_FALSE(QVDictionary().merging({}).isAbsent());
}

TEST(QVDictionary, MergesIntoSomethingSelfContained) {
  QVDictionary merged;
  {
    const QVDictionary base{{"first", "characters of the one"}};
    merged = base.merging({{"second", "characters of the other"}});
  }
  EXPECT_EQ(merged, (QVDictionary{{"first", "characters of the one"},
                                  {"second", "characters of the other"}}));
}

TEST(QVDictionary, ChargesItsBytesUntilTheLastHandleGoes) {
  QVFakeMemoryCharge charge;
  {
    std::vector<QVDictionaryEntry> entries{{"key", "value"}, {"nested", QVArray{"some text"}}};
    QVDictionary dictionary = QVDictionary::assemble(entries, &charge);
    EXPECT_EQ(dictionary.charge(), &charge);
    EXPECT_EQ(charge.held(), dictionary.footprint());
    const QVDictionary copy = dictionary;  // NOLINT(performance-unnecessary-copy-initialization)
    EXPECT_EQ(charge.held(), dictionary.footprint()) << "handles share";
    dictionary = {};
    EXPECT_EQ(charge.held(), copy.footprint());
  }
  EXPECT_EQ(charge.held(), 0u);
}

TEST(QVDictionary, ChargesAMergeAsItIsToldAndNotAsItsParts) {
  QVFakeMemoryCharge charge;
  QVFakeMemoryCharge other;
  {
    std::vector<QVDictionaryEntry> entries{{"a", "text"}};
    const QVDictionary base = QVDictionary::assemble(entries, &charge);
    const QVDictionary merged = base.merging({{"b", "more"}}, &other);
    EXPECT_EQ(merged.charge(), &other);
    EXPECT_EQ(other.held(), merged.footprint());
    EXPECT_EQ(charge.held(), base.footprint());
    EXPECT_EQ(base.merging({}).charge(), nullptr);
    EXPECT_EQ((QVDictionary{{"b", 1}}).merging(base).charge(), nullptr);
  }
  EXPECT_EQ(charge.held(), 0u);
  EXPECT_EQ(other.held(), 0u);
}

TEST(QVDictionary, CountsItsContentsInItsFootprint) {
  const QVDictionary small{{"a", 1}};
  const QVDictionary text{{"a", std::string(1000, 'x')}};
  const QVDictionary nested{{"a", QVArray{std::string(1000, 'x')}}};
  EXPECT_GE(small.footprint(), sizeof(QVDictionaryEntry) + 1);
  EXPECT_EQ(text.footprint(), small.footprint() + 1000);
  EXPECT_GE(nested.footprint(), small.footprint() + 1000 + sizeof(QVValue));
}

TEST(QVDictionary, IsSharedByThreadsWithoutLocks) {
  QVFakeMemoryCharge charge;
  {
    std::vector<QVDictionaryEntry> entries{{"text", "of all threads"}, {"number", 1}};
    QVDictionary shared = QVDictionary::assemble(entries, &charge);
    std::vector<std::jthread> threads;
    for (int thread = 0; thread < 4; ++thread) {
      threads.emplace_back([dictionary = shared] {
        for (int i = 0; i < 2000; ++i) {
          const QVDictionary copy = dictionary;  // NOLINT(performance-unnecessary-copy-*)
          const QVValue value = *copy.find("text");
          ASSERT_EQ(value.string(), "of all threads");
        }
      });
    }
    shared = {};
  }
  EXPECT_EQ(charge.held(), 0u);
}

}  // namespace
