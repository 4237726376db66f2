#include "tools/qvctl/QVEventPrinter.h"

#include "platform/QVText.h"
#include "tools/qvctl/QVTimeText.h"

#include <string>
#include <string_view>
#include <vector>

namespace {

using Kind = QVStoredEvent::Kind;
using Style = QVToolOutput::Style;

std::string contentsOf(const QVStoredEvent& event) {
  switch (event.kind) {
    case Kind::loss:
      return QVText(event.count, " lost: ", event.name);
    case Kind::energy:
      return QVText(event.name, " ", event.payload);
    case Kind::analytics:
      // Category and type say it already, where there are such.
      return event.category && event.type ? event.payload : QVText(event.name, " ", event.payload);
    default:
      return event.payload;
  }
}

Style styleOf(Kind kind) {
  switch (kind) {
    case Kind::start:
    case Kind::stop:
      return Style::good;
    case Kind::loss:
      return Style::bad;
    case Kind::message:
      return Style::plain;
    default:
      return Style::dim;
  }
}

// On a narrower terminal little would be left for the contents: then lines have the time of day
// alone, and each day begins with its date.
constexpr std::size_t kWideColumns = 140;
// On a still narrower one columns are left out, unless lines are not cut: the service first, which
// the session tells, then category and type.
constexpr std::size_t kServiceColumns = 100;
constexpr std::size_t kCategoryColumns = 72;
// Names that are longer than their columns are cut, though not to less.
constexpr std::size_t kLeastOfNames = 5;
constexpr std::size_t kDateBytes = std::string_view("2026-11-21").size();

bool isNarrow(const QVToolOutput& output) {
  return output.columns() > 0 && output.columns() < kWideColumns;
}

bool hasRoom(const QVToolOutput& output, bool isInFull, std::size_t columns) {
  return isInFull || !isNarrow(output) || output.columns() >= columns;
}

std::vector<QVTable::Column> columnsFor(const QVToolOutput& output, bool isInFull) {
  using Align = QVTable::Align;
  if (isNarrow(output)) {
    std::vector<QVTable::Column> columns{
        {"TIME", Align::left, 15}, {"KIND", Align::left, 9}, {"SESSION", Align::right, 7}};
    if (hasRoom(output, isInFull, kServiceColumns)) {
      columns.push_back({"SERVICE", Align::left, 9, kLeastOfNames});
    }
    if (hasRoom(output, isInFull, kCategoryColumns)) {
      columns.push_back({"CATEGORY", Align::left, 10, kLeastOfNames});
      columns.push_back({"TYPE", Align::left, 5, kLeastOfNames});
    }
    columns.push_back({"CONTENTS"});
    return columns;
  }
  return {{"TIME", Align::left, 26},
          {"KIND", Align::left, 9},
          {"SESSION", Align::right, 8},
          {"SERVICE", Align::left, 16, kLeastOfNames},
          {"CATEGORY", Align::left, 20, kLeastOfNames},
          {"TYPE", Align::left, 8, kLeastOfNames},
          {"CONTENTS"}};
}

}  // namespace

QVEventPrinter::QVEventPrinter(QVToolOutput& output, bool isInFull)
    : output_(output),
      isNarrow_(isNarrow(output)),
      hasService_(hasRoom(output, isInFull, kServiceColumns)),
      hasCategory_(hasRoom(output, isInFull, kCategoryColumns)),
      table_(output, columnsFor(output, isInFull)) {
  if (isInFull) table_.showInFull();
}

void QVEventPrinter::showTitles() {
  if (!output_.isJSON()) table_.showTitles();
}

void QVEventPrinter::show(const QVStoredEvent& event) {
  if (output_.isJSON()) {
    output_.json(event.json());
    return;
  }
  std::string time = QVLocalTimeText(event.time);
  if (isNarrow_) {
    const std::string date = time.substr(0, kDateBytes);
    if (date != date_) output_.line(output_.painted(Style::title, date));
    date_ = date;
    time.erase(0, kDateBytes + 1);
  }
  QVTable::Row row{time,
                   {std::string(QVStoredEvent::kindName(event.kind)), styleOf(event.kind)},
                   event.session ? std::to_string(*event.session) : std::string()};
  if (hasService_) row.emplace_back(event.service);
  if (hasCategory_) {
    row.emplace_back(event.categoryText());
    row.emplace_back(event.typeText());
  }
  row.emplace_back(contentsOf(event));
  table_.show(std::move(row));
}
