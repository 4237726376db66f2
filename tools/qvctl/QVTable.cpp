#include "tools/qvctl/QVTable.h"

#include "tools/qvctl/QVDisplayText.h"

#include <algorithm>
#include <utility>

namespace {

constexpr std::size_t kGap = 2;

// The last column is not cut to less than this; the line is wrapped then.
constexpr std::size_t kLeastColumns = 16;

}  // namespace

QVTable::QVTable(QVToolOutput& output, std::vector<Column> columns)
    : output_(output), columns_(std::move(columns)) {}

void QVTable::makeSafe(Row& row) {
  for (Cell& cell : row) cell.text = QVDisplayText(cell.text);
}

void QVTable::add(Row row) {
  makeSafe(row);
  rows_.push_back(std::move(row));
}

void QVTable::print() {
  std::vector<std::size_t> widths;
  for (const Column& column : columns_) {
    widths.push_back(std::max(column.width, QVDisplayWidth(column.title)));
  }
  for (const Row& row : rows_) {
    for (std::size_t i = 0; i < row.size(); ++i) {
      widths[i] = std::max(widths[i], QVDisplayWidth(row[i].text));
    }
  }
  Row titles;
  for (const Column& column : columns_) {
    titles.emplace_back(column.title, QVToolOutput::Style::title);
  }
  printRow(titles, widths);
  for (const Row& row : rows_) printRow(row, widths);
  rows_.clear();
}

void QVTable::showTitles() {
  Row titles;
  for (const Column& column : columns_) {
    titles.emplace_back(column.title, QVToolOutput::Style::title);
  }
  show(std::move(titles));
}

void QVTable::show(Row row) {
  makeSafe(row);
  std::vector<std::size_t> widths;
  for (const Column& column : columns_) {
    widths.push_back(std::max(column.width, QVDisplayWidth(column.title)));
  }
  printRow(row, widths);
}

void QVTable::printRow(const Row& row, const std::vector<std::size_t>& widths) {
  std::string line;
  std::size_t used = 0;
  for (std::size_t i = 0; i < row.size(); ++i) {
    const bool isLast = i + 1 == row.size();
    std::string text = row[i].text;
    const std::size_t end = output_.columns();
    if (isLast && end >= used + kLeastColumns && !isInFull_) text = QVClippedText(text, end - used);
    const std::size_t width = QVDisplayWidth(text);
    const std::size_t padding = widths[i] > width ? widths[i] - width : 0;
    const bool isRight = columns_[i].align == Align::right;
    if (isRight) line.append(padding, ' ');
    line.append(output_.painted(row[i].style, text));
    if (!isRight && !isLast) line.append(padding, ' ');
    if (!isLast) line.append(kGap, ' ');
    used += width + padding + kGap;
  }
  // Empty cells at the end leave blanks behind.
  line.erase(line.find_last_not_of(' ') + 1);
  output_.line(line);
}
