#include "platform/QVText.h"
#include "platform/linux/tally/QVKernelText.h"

#include <string>
#include <vector>

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

// "KEY=VALUE", or nothing.
std::string counted(std::string_view line) {
  const auto counter = QVKernelText::parseLine(line);
  return counter ? QVText(counter->key, '=', counter->value) : "";
}

std::vector<std::string> lines(std::string_view text) {
  std::vector<std::string> lines;
  while (const auto line = QVKernelText::takeLine(text)) lines.emplace_back(*line);
  return lines;
}

TEST(QVKernelText, CountsKeyColonValue) {
  EXPECT_EQ(counted("frames: 12"), "frames=12");
  EXPECT_EQ(counted("frames:\t12"), "frames=12");
  EXPECT_EQ(counted("hw_ptr      : 4096"), "hw_ptr=4096");
  EXPECT_EQ(counted("VmRSS:\t    1234 kB"), "VmRSS=1234");
  EXPECT_EQ(counted("frames:12"), "frames=12");
  EXPECT_EQ(counted("Ring 0: 5"), "Ring 0=5");
  EXPECT_EQ(counted("queue 12 depth: 5"), "queue 12 depth=5");
}

TEST(QVKernelText, CountsKeyValue) {
  EXPECT_EQ(counted("frames 12"), "frames=12");
  EXPECT_EQ(counted("frames\t12"), "frames=12");
  EXPECT_EQ(counted("cpu  123 456"), "cpu=123");
  EXPECT_EQ(counted("frames 12 at 10:30"), "frames=12");
  EXPECT_EQ(counted("a:b 12"), "a:b=12");
}

TEST(QVKernelText, CountsAnIntegerThatEndsThereOrAtABlank) {
  EXPECT_EQ(counted("frames: 12 frames"), "frames=12");
  EXPECT_EQ(counted("frames: 12\tframes"), "frames=12");
  EXPECT_EQ(counted("frames: 0"), "frames=0");
  EXPECT_EQ(counted("frames: 007"), "frames=7");
  EXPECT_EQ(counted("frames: -12"), "frames=-12");
}

TEST(QVKernelText, CountsNothingElse) {
  for (const char* line : {"",
                           " ",
                           ":",
                           ": ",
                           ": 12",
                           "12",
                           " 12 ",
                           "frames",
                           "frames:",
                           "frames: ",
                           "frames: 1.5",
                           "frames: 0x10",
                           "frames: 12kB",
                           "frames: 12,",
                           "frames: +12",
                           "frames: -",
                           "frames: - 12",
                           "frames: --12",
                           "frames: twelve",
                           "frames: twelve 12",
                           "state: RUNNING",
                           "-----",
                           "frames 1.5",
                           "frames 12kB",
                           "trigger_time: 123.456",
                           "frames: 12\r"}) {
    EXPECT_EQ(counted(line), "") << '"' << line << '"';
  }
}

TEST(QVKernelText, IgnoresBlanksAroundKeyAndValue) {
  EXPECT_EQ(counted("  frames  :  12  "), "frames=12");
  EXPECT_EQ(counted("\t frames \t 12 \t"), "frames=12");
}

TEST(QVKernelText, SaturatesLargeValues) {
  EXPECT_EQ(counted("a: 9223372036854775807"), "a=9223372036854775807");
  EXPECT_EQ(counted("a: 9223372036854775808"), "a=9223372036854775807");
  EXPECT_EQ(counted("a: 18446744073709551615"), "a=9223372036854775807");
  EXPECT_EQ(counted("a: -9223372036854775809"), "a=-9223372036854775808");
  EXPECT_EQ(counted("a: " + std::string(1000, '9')), "a=9223372036854775807");
}

TEST(QVKernelText, LimitsKeys) {
  const std::string longest(QVKernelText::kMaximumKeyBytes, 'k');
  EXPECT_EQ(counted(longest + ": 1"), longest + "=1");
  EXPECT_EQ(counted(longest + "k: 1"), "");
  EXPECT_EQ(counted(longest + "k 1"), "");
}

TEST(QVKernelText, TakesKeysOfAnyBytes) {
  EXPECT_EQ(counted("\xFF\x01: 1"), "\xFF\x01=1");
  EXPECT_EQ(counted(std::string_view("a\0b: 1", 6)), std::string("a\0b=1", 5));
  EXPECT_EQ(counted(std::string_view("a: 1\0", 5)), "");
}

TEST(QVKernelText, TakesLinesApart) {
  EXPECT_THAT(lines(""), IsEmpty());
  EXPECT_THAT(lines("a"), ElementsAre("a"));
  EXPECT_THAT(lines("a\n"), ElementsAre("a"));
  EXPECT_THAT(lines("a\n\nb"), ElementsAre("a", "", "b"));
  EXPECT_THAT(lines("\n"), ElementsAre(""));
}

}  // namespace
