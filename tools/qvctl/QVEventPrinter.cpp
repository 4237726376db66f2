#include "tools/qvctl/QVEventPrinter.h"

#include "platform/QVText.h"
#include "tools/qvctl/QVTimeText.h"

#include <string>

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

}  // namespace

QVEventPrinter::QVEventPrinter(QVToolOutput& output, bool isInFull)
    : output_(output),
      table_(output, {{"TIME", QVTable::Align::left, 26},
                      {"KIND", QVTable::Align::left, 9},
                      {"SESSION", QVTable::Align::right, 8},
                      {"SERVICE", QVTable::Align::left, 13},
                      {"CATEGORY", QVTable::Align::left, 16},
                      {"TYPE", QVTable::Align::left, 8},
                      {"CONTENTS"}}) {
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
  table_.show({QVLocalTimeText(event.time),
               {std::string(QVStoredEvent::kindName(event.kind)), styleOf(event.kind)},
               event.session ? std::to_string(*event.session) : std::string(),
               event.service,
               event.categoryText(),
               event.typeText(),
               contentsOf(event)});
}
