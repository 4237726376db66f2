#pragma once

#include "tools/qvctl/QVToolOutput.h"

#include <cstddef>
#include <string>
#include <vector>

// Rows in columns, aligned by what they take on a terminal. The last column is as wide as it comes.
// On a terminal no line is longer than it, unless all is to be shown in full: columns that may be
// cut give way first, the widest one before the others, then the line is cut where it ends.
//
//   QVTable table(output, {{"SESSION", QVTable::Align::right}, {"SERVICE"}});
//   table.add({"7", "telephony"});
//   table.print();
//
// For rows that come one by one, show() prints each at once, in columns of their smallest widths;
// on a terminal those that may be cut are cut to them.
//
// Cells are made safe here (QVDisplayText). Threads: one at a time.
class QVTable {
 public:
  enum class Align { left, right };
  struct Column {
    std::string title;
    Align align = Align::left;
    std::size_t width = 0;  // at least
    std::size_t least = 0;  // where it has to be cut; 0: it is not cut while there is room
  };
  struct Cell {
    Cell(std::string cellText, QVToolOutput::Style cellStyle = QVToolOutput::Style::plain)
        : text(std::move(cellText)), style(cellStyle) {}
    Cell(const char* cellText) : text(cellText) {}
    std::string text;
    QVToolOutput::Style style = QVToolOutput::Style::plain;
  };
  using Row = std::vector<Cell>;

  QVTable(QVToolOutput& output, std::vector<Column> columns);

  void showInFull() { isInFull_ = true; }

  // Keeps a row, of as many cells as there are columns, for print().
  void add(Row row);
  // The titles and all rows, which are forgotten.
  void print();

  void showTitles();
  void show(Row row);

 private:
  static void makeSafe(Row& row);
  bool isCut() const { return !isInFull_ && output_.columns() > 0; }
  std::vector<std::size_t> smallestWidths() const;
  // Takes so much off the columns that may be cut that a line fits, as far as they go.
  void narrow(std::vector<std::size_t>& widths) const;
  void printRow(const Row& row, const std::vector<std::size_t>& widths);

  QVToolOutput& output_;
  const std::vector<Column> columns_;
  bool isInFull_ = false;
  std::vector<Row> rows_;
};
