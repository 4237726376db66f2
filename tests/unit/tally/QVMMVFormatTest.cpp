#include "platform/QVText.h"
#include "platform/linux/tally/QVMMVFormat.h"
#include "tests/unit/tally/QVTestMMV.h"

#include <algorithm>
#include <cerrno>
#include <limits>
#include <memory>
#include <string>
#include <vector>

#include <gmock/gmock.h>

namespace {

using testing::AnyOf;
using testing::ElementsAre;
using testing::IsEmpty;

constexpr int64_t kLeast = std::numeric_limits<int64_t>::min();
constexpr int64_t kMost = std::numeric_limits<int64_t>::max();

// "SUBGROUP NAME VALUE" of each channel.
std::vector<std::string> contents(const QVChannelReadings& readings) {
  std::vector<std::string> contents;
  for (const auto& channel : readings.channels) {
    contents.push_back(QVText(channel.subgroup, ' ', channel.name, ' ', channel.value));
  }
  return contents;
}

// What the bytes hold. They lie in memory of exactly their size, so that a look beyond is seen.
class Outcome {
 public:
  explicit Outcome(const std::string& bytes) : memory_(bytes.begin(), bytes.end()) {
    error = QVMMVFormat::parse({memory_.data(), memory_.size()}, readings);
  }
  bool pointsInto(std::string_view text) const {
    return text.data() >= memory_.data() &&
           text.data() + text.size() <= memory_.data() + memory_.size();
  }

  int error = 0;
  QVChannelReadings readings;

 private:
  std::vector<char> memory_;
};

std::vector<std::string> parsed(const std::string& bytes) {
  const Outcome outcome(bytes);
  EXPECT_EQ(outcome.error, 0);
  return contents(outcome.readings);
}

int errorOf(const std::string& bytes) {
  return Outcome(bytes).error;
}

// Two subgroups with two channels each, one channel of the group itself, and a text.
QVTestMMV sample() {
  return {.subgroups = {"left", "right"},
          .metrics = {{"frames", {1, 2}, kUnsigned64, true},
                      {"underruns", {3, 4}, kSigned32, true},
                      {"opens", {5}}},
          .texts = 1};
}

template <class Number>
std::string patched(std::size_t offset, Number number) {
  std::string bytes = sample().bytes();
  QVPatch(bytes, offset, number);
  return bytes;
}

TEST(QVMMVFormat, ReadsChannelsWithAndWithoutSubgroups) {
  const Outcome outcome(sample().bytes());
  EXPECT_EQ(outcome.error, 0);
  EXPECT_THAT(contents(outcome.readings),
              ElementsAre("left frames 1", "right frames 2", "left underruns 3",
                          "right underruns 4", "(null) opens 5"));
  EXPECT_THAT(outcome.readings.subgroups, ElementsAre("left", "right", std::nullopt));
}

TEST(QVMMVFormat, ReadsEachTypeOfNumber) {
  const QVTestMMV file{.metrics = {{"i32", {QVTestCell(int32_t{-2})}, kSigned32},
                                   {"u32", {QVTestCell(UINT32_MAX)}, kUnsigned32},
                                   {"i64", {QVTestCell(kLeast)}, kSigned64},
                                   {"u64", {12}, kUnsigned64},
                                   {"float", {QVTestCell(-1.5F)}, kFloat},
                                   {"double", {QVTestCell(1e15)}, kDouble}}};
  EXPECT_THAT(
      parsed(file.bytes()),
      ElementsAre("(null) i32 -2", "(null) u32 4294967295", "(null) i64 -9223372036854775808",
                  "(null) u64 12", "(null) float -1", "(null) double 1000000000000000"));
}

TEST(QVMMVFormat, LooksOnlyAtThePartOfACellThatTheTypeHas) {
  const QVTestMMV file{.metrics = {{"i32", {0xFFFFFFFF00000001}, kSigned32},
                                   {"u32", {0xFFFFFFFF00000002}, kUnsigned32},
                                   {"float", {0xFFFFFFFF00000000}, kFloat}}};
  EXPECT_THAT(parsed(file.bytes()), ElementsAre("(null) i32 1", "(null) u32 2", "(null) float 0"));
}

TEST(QVMMVFormat, SaturatesWildNumbers) {
  using Doubles = std::numeric_limits<double>;
  const QVTestMMV file{
      .metrics = {{"u64", {UINT64_MAX}},
                  {"inf", {QVTestCell(Doubles::infinity())}, kDouble},
                  {"-inf", {QVTestCell(-Doubles::infinity())}, kDouble},
                  {"nan", {QVTestCell(Doubles::quiet_NaN())}, kDouble},
                  {"max", {QVTestCell(std::numeric_limits<float>::max())}, kFloat}}};
  EXPECT_THAT(
      parsed(file.bytes()),
      ElementsAre(QVText("(null) u64 ", kMost), QVText("(null) inf ", kMost),
                  QVText("(null) -inf ", kLeast), "(null) nan 0", QVText("(null) max ", kMost)));
}

TEST(QVMMVFormat, TakesTheFinishedPartOfElapsedTimes) {
  const QVTestMMV file{.metrics = {{"busy", {250}, kElapsed}}};
  std::string bytes = file.bytes();
  QVPatch(bytes, file.valueAt() + 8, int64_t{-1'700'000'000'000'000});  // an interval is running
  EXPECT_THAT(parsed(bytes), ElementsAre("(null) busy 250"));
}

TEST(QVMMVFormat, LeavesOutTextsAndUnknownTypes) {
  const QVTestMMV file{.metrics = {{"text", {0}, kText},
                                   {"aggregate", {0}, 7},
                                   {"unsupported", {0}, -1},
                                   {"unknown", {0}, 1000},
                                   {"frames", {1}}}};
  EXPECT_THAT(parsed(file.bytes()), ElementsAre("(null) frames 1"));
}

TEST(QVMMVFormat, TellsCellsWithoutAValueWhereTheFileSaysSo) {
  QVTestMMV file{.metrics = {{"u64", {UINT64_MAX}},
                             {"i32", {UINT64_MAX}, kSigned32},
                             {"u32", {UINT32_MAX}, kUnsigned32},
                             {"busy", {UINT64_MAX}, kElapsed},
                             {"float", {UINT32_MAX}, kFloat},
                             {"double", {UINT64_MAX}, kDouble},
                             {"one", {1}}}};
  EXPECT_THAT(parsed(file.bytes()),
              ElementsAre(QVText("(null) u64 ", kMost), "(null) i32 -1", "(null) u32 4294967295",
                          "(null) busy -1", "(null) float 0", "(null) double 0", "(null) one 1"));
  file.flags = 4;
  EXPECT_THAT(parsed(file.bytes()),
              ElementsAre("(null) u64 (null)", "(null) i32 (null)", "(null) u32 4294967295",
                          "(null) busy (null)", "(null) float (null)", "(null) double (null)",
                          "(null) one 1"));
}

TEST(QVMMVFormat, ReadsWhatADeadPublisherLeft) {
  QVTestMMV file = sample();
  file.flags = 2;  // "look whether the process is there"
  std::string bytes = file.bytes();
  QVPatch(bytes, 32, int32_t{-1});  // it is not
  EXPECT_EQ(parsed(bytes).size(), 5U);
}

TEST(QVMMVFormat, TakesChannelsWithoutANameAndWithTheSameName) {
  const QVTestMMV file{.metrics = {{"", {1}}, {"a", {2}}, {"a", {3}}}};
  EXPECT_THAT(parsed(file.bytes()), ElementsAre("(null)  1", "(null) a 2", "(null) a 3"));
}

TEST(QVMMVFormat, PublishesSubgroupsThatHaveNoChannels) {
  const Outcome outcome(QVTestMMV{.subgroups = {"left"}}.bytes());
  EXPECT_EQ(outcome.error, 0);
  EXPECT_THAT(outcome.readings.subgroups, ElementsAre("left"));
  EXPECT_THAT(outcome.readings.channels, IsEmpty());
}

TEST(QVMMVFormat, PublishesTheGroupOfAFileWithoutChannels) {
  const Outcome outcome(QVTestMMV{}.bytes());
  EXPECT_EQ(outcome.error, 0);
  EXPECT_THAT(outcome.readings.subgroups, ElementsAre(std::nullopt));
  EXPECT_THAT(outcome.readings.channels, IsEmpty());
}

TEST(QVMMVFormat, TakesNamesOfEachLength) {
  const std::string longest(63, 'n');
  EXPECT_THAT(parsed(QVTestMMV{.metrics = {{longest, {1}}}}.bytes()),
              ElementsAre("(null) " + longest + " 1"));
  EXPECT_EQ(errorOf(QVTestMMV{.metrics = {{std::string(64, 'n'), {1}}}}.bytes()), EBADMSG);
  const QVTestMMV grouped{.subgroups = {std::string(64, 'n')}};
  EXPECT_EQ(errorOf(grouped.bytes()), EBADMSG);
}

TEST(QVMMVFormat, RefusesOtherFilesAndOtherVersions) {
  EXPECT_EQ(errorOf(""), EBADMSG);
  EXPECT_EQ(errorOf(std::string(4096, '\0')), EBADMSG);
  EXPECT_EQ(errorOf(patched(0, 'm')), EBADMSG);
  EXPECT_EQ(errorOf(patched(3, ' ')), EBADMSG);
  for (const int32_t version : {0, 2, 3, -1, 0x01000000}) {
    EXPECT_EQ(errorOf(patched(4, version)), ENOTSUP) << version;
  }
}

TEST(QVMMVFormat, WaitsForTheSecondGeneration) {
  EXPECT_EQ(errorOf(patched(8, uint64_t{6})), EAGAIN);
  EXPECT_EQ(errorOf(patched(16, uint64_t{8})), EAGAIN);
  EXPECT_EQ(errorOf(patched(16, uint64_t{0})), EAGAIN);
  QVTestMMV file = sample();
  file.generation = 0;
  EXPECT_EQ(errorOf(file.bytes()), EAGAIN);
}

TEST(QVMMVFormat, RefusesCountsThatTheFileHasNoRoomFor) {
  const std::size_t sections = sample().sections();
  for (const int32_t count :
       {-1, std::numeric_limits<int32_t>::min(), std::numeric_limits<int32_t>::max(), 17, 1000}) {
    EXPECT_EQ(errorOf(patched(24, count)), EBADMSG) << count << " sections";
    for (std::size_t i = 0; i < sections; ++i) {
      EXPECT_EQ(errorOf(patched(QVTestMMV::kHeader + i * QVTestMMV::kSection + 4, count)), EBADMSG)
          << count << " of section " << i;
    }
  }
}

TEST(QVMMVFormat, RefusesOffsetsOutsideOfTheFile) {
  const std::string bytes = sample().bytes();
  for (std::size_t i = 0; i < sample().sections(); ++i) {
    for (const uint64_t offset :
         {uint64_t{bytes.size()}, uint64_t{bytes.size() - 1}, uint64_t{bytes.size() + 1},
          UINT64_MAX, UINT64_MAX - 31, uint64_t{1} << 63, uint64_t{1} << 32}) {
      EXPECT_EQ(errorOf(patched(QVTestMMV::kHeader + i * QVTestMMV::kSection + 8, offset)), EBADMSG)
          << offset << " of section " << i;
    }
  }
}

TEST(QVMMVFormat, RefusesSectionsThatOverlap) {
  const QVTestMMV file = sample();
  const auto sectionAt = [](std::size_t i) {
    return QVTestMMV::kHeader + i * QVTestMMV::kSection + 8;
  };
  EXPECT_EQ(errorOf(patched(sectionAt(3), uint64_t{0})), EBADMSG) << "values over the header";
  EXPECT_EQ(errorOf(patched(sectionAt(3), uint64_t{QVTestMMV::kHeader})), EBADMSG) << "contents";
  EXPECT_EQ(errorOf(patched(sectionAt(3), uint64_t{file.metricAt()})), EBADMSG) << "metrics";
  EXPECT_EQ(errorOf(patched(sectionAt(3), uint64_t{file.valueAt() - 8})), EBADMSG) << "in part";
  EXPECT_EQ(errorOf(patched(sectionAt(1), uint64_t{file.domainAt()})), EBADMSG) << "domain";
}

TEST(QVMMVFormat, RefusesSectionsOfUnknownKindsAndTwoOfOneKind) {
  for (const int32_t kind : {0, 6, 7, -1, std::numeric_limits<int32_t>::max()}) {
    EXPECT_EQ(errorOf(patched(QVTestMMV::kHeader, kind)), EBADMSG) << kind;
  }
  EXPECT_EQ(errorOf(patched(QVTestMMV::kHeader + 4 * QVTestMMV::kSection, int32_t{1})), EBADMSG)
      << "the texts are a second domain";
}

TEST(QVMMVFormat, RefusesValuesThatPointElsewhere) {
  const QVTestMMV file = sample();
  for (const uint64_t offset :
       {uint64_t{0}, uint64_t{file.metricAt() + 1}, uint64_t{file.metricAt() - 104},
        uint64_t{file.metricAt(3)}, uint64_t{file.instanceAt()}, UINT64_MAX, UINT64_MAX - 103}) {
    EXPECT_EQ(errorOf(patched(file.valueAt() + 16, offset)), EBADMSG) << "metric " << offset;
  }
  for (const uint64_t offset :
       {uint64_t{0}, uint64_t{file.instanceAt() + 1}, uint64_t{file.instanceAt(2)},
        uint64_t{file.metricAt()}, UINT64_MAX, UINT64_MAX - 79}) {
    EXPECT_EQ(errorOf(patched(file.valueAt() + 24, offset)), EBADMSG) << "instance " << offset;
  }
  // A metric without a domain does not look at it.
  EXPECT_EQ(errorOf(patched(file.valueAt(4) + 24, UINT64_MAX)), 0);
}

TEST(QVMMVFormat, RefusesInstancesOfAnotherDomain) {
  const QVTestMMV file = sample();
  for (const uint64_t offset :
       {uint64_t{0}, uint64_t{file.domainAt() + 8}, uint64_t{file.instanceAt()}, UINT64_MAX}) {
    EXPECT_EQ(errorOf(patched(file.instanceAt(), offset)), EBADMSG) << offset;
  }
  EXPECT_EQ(errorOf(patched(file.domainAt(), uint32_t{6})), EBADMSG) << "another serial";
  EXPECT_EQ(errorOf(patched(file.metricAt() + 80, uint32_t{6})), EBADMSG) << "another's metric";
}

TEST(QVMMVFormat, RefusesEveryTruncation) {
  const std::string bytes = sample().bytes();
  for (std::size_t length = 0; length < bytes.size(); ++length) {
    EXPECT_EQ(errorOf(bytes.substr(0, length)), EBADMSG) << length;
  }
}

TEST(QVMMVFormat, StaysWithinTheBytesWhicheverOfThemIsWrong) {
  const std::string bytes = sample().bytes();
  std::size_t refused = 0;
  std::size_t taken = 0;
  for (std::size_t at = 0; at < bytes.size(); ++at) {
    for (const int change : {1, 2, 4, 8, 16, 32, 64, 128, 255}) {
      std::string wrong = bytes;
      wrong[at] = static_cast<char>(wrong[at] ^ change);
      const Outcome outcome(wrong);
      EXPECT_THAT(outcome.error, AnyOf(0, EBADMSG, EAGAIN, ENOTSUP));
      ++(outcome.error == 0 ? taken : refused);
      if (outcome.error != 0) continue;
      for (const auto& channel : outcome.readings.channels) {
        EXPECT_TRUE(channel.name.empty() || outcome.pointsInto(channel.name)) << at;
        EXPECT_TRUE(!channel.subgroup || outcome.pointsInto(*channel.subgroup)) << at;
      }
    }
  }
  // Most bytes are names, cells and texts, which may be anything.
  EXPECT_GT(refused, 1500U);
  EXPECT_GT(taken, 1500U);
}

TEST(QVMMVFormat, ComparesHeadersAlone) {
  const std::string bytes = sample().bytes();
  std::string counted = bytes;
  counted[sample().valueAt()] = 'x';
  EXPECT_TRUE(QVMMVFormat::sameHeader(bytes, counted));
  EXPECT_TRUE(QVMMVFormat::sameHeader(bytes, bytes.substr(0, 40)));
  EXPECT_FALSE(QVMMVFormat::sameHeader(bytes, bytes.substr(0, 39)));
  EXPECT_FALSE(QVMMVFormat::sameHeader(bytes, patched(16, uint64_t{8})));
}

}  // namespace
