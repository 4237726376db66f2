#include "tests/unit/tool/QVOutputFile.h"
#include "tools/qvctl/QVTable.h"

#include <cstdlib>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/ioctl.h>
#include <termios.h>
#include <unistd.h>

namespace {

using Align = QVTable::Align;

class QVTableTest : public testing::Test {
 protected:
  std::string text() {
    output_.flush();
    return file_.text();
  }

  const QVOutputFile file_;
  QVToolOutput output_{false, file_.descriptor()};
};

TEST_F(QVTableTest, AlignsColumns) {
  QVTable table(output_, {{"N", Align::right}, {"NAME"}, {"END"}});
  table.add({"7", "short", "x"});
  table.add({"1234", "a longer one", "y"});
  table.print();
  EXPECT_EQ(text(),
            "   N  NAME          END\n"
            "   7  short         x\n"
            "1234  a longer one  y\n");
}

TEST_F(QVTableTest, AlignsByWhatCharactersTake) {
  QVTable table(output_, {{"NAME"}, {"END"}});
  table.add({"日本", "1"});
  table.add({"grüß", "2"});
  table.add({"e\xCC\x81", "3"});
  table.print();
  EXPECT_EQ(text(),
            "NAME  END\n"
            "日本  1\n"
            "grüß  2\n"
            "e\xCC\x81     3\n");
}

TEST_F(QVTableTest, HasNoBlanksAtTheEndOfLines) {
  QVTable table(output_, {{"NAME"}, {"END"}});
  table.add({"a", ""});
  table.print();
  EXPECT_EQ(text(), "NAME  END\na\n");
}

TEST_F(QVTableTest, KeepsHostileTextInItsCell) {
  QVTable table(output_, {{"NAME"}, {"END"}});
  table.add({"a\nb\033[2J", "1"});
  table.print();
  EXPECT_EQ(text(),
            "NAME         END\n"
            "a\\nb\\x1B[2J  1\n");
}

TEST_F(QVTableTest, ShowsRowsOneByOne) {
  QVTable table(output_, {{"KIND", Align::left, 6}, {"ID", Align::right, 4}, {"TEXT"}});
  table.showTitles();
  table.show({"a", "7", "t"});
  table.show({"too long", "7", "t"});
  EXPECT_EQ(text(),
            "KIND      ID  TEXT\n"
            "a          7  t\n"
            "too long     7  t\n");
}

// A table on a terminal of 30 columns.
class QVTableOnTerminalTest : public testing::Test {
 protected:
  void SetUp() override {
    ASSERT_GE(reader_, 0);
    ASSERT_EQ(::grantpt(reader_), 0);
    ASSERT_EQ(::unlockpt(reader_), 0);
    char name[64] = "";
    ASSERT_EQ(::ptsname_r(reader_, name, sizeof name), 0);
    terminal_ = ::open(name, O_RDWR | O_NOCTTY | O_CLOEXEC);
    ASSERT_GE(terminal_, 0);
    const winsize size{.ws_row = 10, .ws_col = 30, .ws_xpixel = 0, .ws_ypixel = 0};
    ASSERT_EQ(::ioctl(terminal_, TIOCSWINSZ, &size), 0);
    termios modes{};
    ASSERT_EQ(::tcgetattr(terminal_, &modes), 0);
    ::cfmakeraw(&modes);
    ASSERT_EQ(::tcsetattr(terminal_, TCSANOW, &modes), 0);
    ::setenv("NO_COLOR", "1", 1);
  }
  void TearDown() override {
    ::unsetenv("NO_COLOR");
    ::close(terminal_);
    ::close(reader_);
  }
  // What the table has printed; it is a few lines, which a terminal takes at once.
  template <class Print>
  std::string shown(Print print) {
    QVToolOutput output(false, terminal_);
    print(output);
    output.flush();
    std::string text(4096, '\0');
    const ssize_t count = ::read(reader_, text.data(), text.size());
    text.resize(count > 0 ? static_cast<std::size_t>(count) : 0);
    return text;
  }

  const int reader_ = ::posix_openpt(O_RDWR | O_NOCTTY | O_CLOEXEC);
  int terminal_ = -1;
};

TEST_F(QVTableOnTerminalTest, CutsTheColumnThatMayBeCut) {
  EXPECT_EQ(shown([](QVToolOutput& output) {
              QVTable table(output, {{"N"}, {.title = "APPLICATION", .least = 11}, {"OWNER"}});
              table.add({"7", std::string(200, 'a'), "player 4711"});
              table.print();
            }),
            "N  APPLICATION     OWNER\n"
            "7  aaaaaaaaaaaaa…  player 4711\n");
}

TEST_F(QVTableOnTerminalTest, CutsTheLineWhereverItEnds) {
  EXPECT_EQ(shown([](QVToolOutput& output) {
              QVTable table(output, {{"NAME", Align::left, 24}, {"N", Align::right, 9}, {"END"}});
              table.showTitles();
              table.show({"a", "1234567", "x"});
              table.show({std::string(31, 'b'), "1", "x"});
            }),
            "NAME                         N\n"
            "a                         123…\n"
            "bbbbbbbbbbbbbbbbbbbbbbbbbbbbb…\n");
}

TEST_F(QVTableOnTerminalTest, CutsALastColumnOfFewColumns) {
  EXPECT_EQ(shown([](QVToolOutput& output) {
              QVTable table(output, {{"NAME", Align::left, 20}, {"END"}});
              table.show({"a", "123456789"});
            }),
            "a                     1234567…\n");
}

TEST_F(QVTableOnTerminalTest, KeepsLongNamesInTheirColumns) {
  EXPECT_EQ(shown([](QVToolOutput& output) {
              QVTable table(output, {{"CATEGORY", Align::left, 10, 5}, {"END"}});
              table.show({"Routing.RouteChange", "x"});
            }),
            "Routing.R…  x\n");
}

TEST_F(QVTableOnTerminalTest, CutsNothingThatIsToBeShownInFull) {
  EXPECT_EQ(shown([](QVToolOutput& output) {
              QVTable table(output, {{.title = "NAME", .least = 5}, {"END"}});
              table.showInFull();
              table.add({std::string(31, 'b'), "x"});
              table.print();
            }),
            "NAME                             END\n" + std::string(31, 'b') + "  x\n");
}

TEST_F(QVTableTest, HasTitlesAloneWhereThereIsNothing) {
  QVTable table(output_, {{"NAME"}, {"END"}});
  table.print();
  EXPECT_EQ(text(), "NAME  END\n");
}

}  // namespace
