#include "tools/qvctl/QVTable.h"

#include "tools/qvctl/QVDisplayText.h"

#include <algorithm>
#include <utility>

namespace {

constexpr std::size_t kGap = 2;

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

std::vector<std::size_t> QVTable::smallestWidths() const {
  std::vector<std::size_t> widths;
  for (const Column& column : columns_) {
    widths.push_back(std::max(column.width, QVDisplayWidth(column.title)));
  }
  return widths;
}

void QVTable::narrow(std::vector<std::size_t>& widths) const {
  const std::size_t end = output_.columns();
  std::size_t total = kGap * (widths.size() - 1);
  for (std::size_t i = 0; i < widths.size(); ++i) {
    // Wider than the line it cannot be anyway, and there is less to take off below.
    if (columns_[i].least > 0) widths[i] = std::min(widths[i], std::max(end, columns_[i].least));
    total += widths[i];
  }
  while (total > end) {
    std::size_t widest = widths.size();
    for (std::size_t i = 0; i < widths.size(); ++i) {
      const bool mayGive = columns_[i].least > 0 && widths[i] > columns_[i].least;
      if (mayGive && (widest == widths.size() || widths[i] > widths[widest])) widest = i;
    }
    if (widest == widths.size()) return;
    --widths[widest];
    --total;
  }
}

void QVTable::print() {
  std::vector<std::size_t> widths = smallestWidths();
  for (const Row& row : rows_) {
    for (std::size_t i = 0; i < row.size(); ++i) {
      widths[i] = std::max(widths[i], QVDisplayWidth(row[i].text));
    }
  }
  if (isCut()) narrow(widths);
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
  printRow(row, smallestWidths());
}

void QVTable::printRow(const Row& row, const std::vector<std::size_t>& widths) {
  const bool cuts = isCut();
  const std::size_t end = output_.columns();
  std::string line;
  std::size_t used = 0;
  for (std::size_t i = 0; i < row.size() && (!cuts || used < end); ++i) {
    const bool isLast = i + 1 == row.size();
    std::string text = row[i].text;
    std::size_t column = widths[i];
    if (cuts) {
      column = std::min(column, end - used);
      text = QVClippedText(text, columns_[i].least > 0 ? column : end - used);
    }
    const std::size_t width = QVDisplayWidth(text);
    const std::size_t padding = column > width ? column - width : 0;
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
