#include "platform/linux/log/QVJournalLogSink.h"
#include "platform/linux/log/QVLogLine.h"

#include <atomic>
#include <string>
#include <string_view>
#include <vector>

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;

std::string escaped(std::string_view text) {
  std::string out;
  QVAppendLogText(out, text);
  return out;
}

TEST(QVLogLineTest, LeavesTextAlone) {
  for (const char* const text :
       {"", "plain", R"(back\slash "quoted")", "\u00e4\u20ac\U0001F3B5 mixed", "\u00a0"}) {
    EXPECT_EQ(escaped(text), text);
  }
}

TEST(QVLogLineTest, EscapesControlCharacters) {
  EXPECT_EQ(escaped("a\nb\rc\td"), R"(a\nb\rc\td)");
  EXPECT_EQ(escaped(std::string_view("\0\x1B[31m\x7F", 7)), R"(\x00\x1b[31m\x7f)");
  EXPECT_EQ(escaped("\u0080\u009b\u009f"), R"(\u0080\u009b\u009f)");
}

TEST(QVLogLineTest, EscapesBytesThatAreNoText) {
  EXPECT_EQ(escaped("a\xFFz"), R"(a\xffz)");
  EXPECT_EQ(escaped("\x80"), R"(\x80)") << "a continuation without a beginning";
  EXPECT_EQ(escaped("\xC3"), R"(\xc3)") << "a beginning without an end";
  EXPECT_EQ(escaped("\xE2\x82z"), R"(\xe2\x82z)");
  EXPECT_EQ(escaped("\xC0\xAF"), R"(\xc0\xaf)") << "longer than needed";
  EXPECT_EQ(escaped("\xED\xA0\x80"), R"(\xed\xa0\x80)") << "half of a pair";
  EXPECT_EQ(escaped("\xF5\x80\x80\x80"), R"(\xf5\x80\x80\x80)") << "beyond the last character";
}

// What the journal would have got.
std::vector<std::vector<std::string>>& sentFields() {
  static std::vector<std::vector<std::string>> sent;
  return sent;
}

int collect(const iovec* fields, int count) {
  auto& entry = sentFields().emplace_back();
  for (int i = 0; i < count; ++i) {
    entry.emplace_back(static_cast<const char*>(fields[i].iov_base), fields[i].iov_len);
  }
  return 0;
}

TEST(QVJournalLogSinkTest, SendsThePartsOfALineAsFields) {
  sentFields().clear();
  QVLogScope scope;
  scope.name = "qvrs";
  scope.subsystem = "net.quillon.quietvox";
  const std::vector<QVLogLine> lines{
      {&scope, QVLogLevel::debug, "-[A b]", "A.cpp", 12, "two\nlines"},
      {nullptr, QVLogLevel::error, "f", "B.cpp", 1, "text"}};
  QVJournalLogSink sink(collect);
  std::atomic<bool> giveUp{false};
  sink.write(lines, giveUp);
  giveUp = true;
  sink.write(lines, giveUp);
  ASSERT_EQ(sentFields().size(), 2U) << "nothing once it is to give up";
  EXPECT_THAT(sentFields()[0], ElementsAre("MESSAGE=two\\nlines", "PRIORITY=7", "CODE_FILE=A.cpp",
                                           "CODE_LINE=12", "CODE_FUNC=-[A b]", "QV_SCOPE=qvrs",
                                           "QV_SUBSYSTEM=net.quillon.quietvox"));
  EXPECT_THAT(sentFields()[1], ElementsAre("MESSAGE=text", "PRIORITY=3", "CODE_FILE=B.cpp",
                                           "CODE_LINE=1", "CODE_FUNC=f", "QV_SCOPE=default"));
}

TEST(QVJournalLogSinkTest, KnowsTheJournalsStream) {
  EXPECT_TRUE(QVIsJournalStream("10:123456", 10, 123456));
  EXPECT_FALSE(QVIsJournalStream("10:123456", 10, 12345));
  EXPECT_FALSE(QVIsJournalStream("11:123456", 10, 123456));
  EXPECT_FALSE(QVIsJournalStream("10:123456x", 10, 123456));
  EXPECT_FALSE(QVIsJournalStream("", 10, 123456));
  EXPECT_FALSE(QVIsJournalStream(nullptr, 10, 123456));
}

}  // namespace
