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
constexpr std::size_t kWideColumns = 130;
constexpr std::size_t kDateBytes = std::string_view("2026-11-21").size();

bool isNarrow(const QVToolOutput& output) {
  return output.columns() > 0 && output.columns() < kWideColumns;
}

std::vector<QVTable::Column> columnsFor(const QVToolOutput& output) {
  using Align = QVTable::Align;
  if (isNarrow(output)) {
    return {{"TIME", Align::left, 15},
            {"KIND", Align::left, 9},
            {"SESSION", Align::right, 7},
            {"SERVICE", Align::left, 9},
            {"CATEGORY", Align::left, 10},
            {"TYPE", Align::left, 5},
            {"CONTENTS"}};
  }
  return {{"TIME", Align::left, 26},
          {"KIND", Align::left, 9},
          {"SESSION", Align::right, 8},
          {"SERVICE", Align::left, 13},
          {"CATEGORY", Align::left, 16},
          {"TYPE", Align::left, 8},
          {"CONTENTS"}};
}

}  // namespace

QVEventPrinter::QVEventPrinter(QVToolOutput& output, bool isInFull)
    : output_(output), isNarrow_(isNarrow(output)), table_(output, columnsFor(output)) {
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
  table_.show({time,
               {std::string(QVStoredEvent::kindName(event.kind)), styleOf(event.kind)},
               event.session ? std::to_string(*event.session) : std::string(),
               event.service,
               event.categoryText(),
               event.typeText(),
               contentsOf(event)});
}
