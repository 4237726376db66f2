#include "tools/qvctl/QVEventsCommand.h"

#include "tools/qvctl/QVEventHistory.h"
#include "tools/qvctl/QVEventPrinter.h"
#include "tools/qvctl/QVTimeText.h"

QVToolStatus QVEventsCommand::run(const QVToolContext& context, const Options& options) {
  const auto store = context.places.directories.store();
  const QVEventRowReader reader(store, QVEventFilter(options.filter, QVTimeNow()));
  if (QVReadOnlyStore::open(store) == nullptr) {
    throw QVToolFailure(QVToolStatus::failed, store.string() + ": there is no event store yet");
  }
  QVEventPrinter printer(context.output, options.full);
  printer.showTitles();
  const auto show = [&printer](const QVStoredEvent& event) { printer.show(event); };
  QVEventHistory history(reader);
  if (options.last) {
    history.readLast(*options.last, show);
  } else {
    history.readAll(show);
  }
  return QVToolStatus::done;
}
