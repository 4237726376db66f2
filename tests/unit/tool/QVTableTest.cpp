#include "tests/unit/tool/QVOutputFile.h"
#include "tools/qvctl/QVTable.h"

#include <gtest/gtest.h>

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

TEST_F(QVTableTest, HasTitlesAloneWhereThereIsNothing) {
  QVTable table(output_, {{"NAME"}, {"END"}});
  table.print();
  EXPECT_EQ(text(), "NAME  END\n");
}

}  // namespace
