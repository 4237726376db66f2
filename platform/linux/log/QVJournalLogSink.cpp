#include "platform/linux/log/QVJournalLogSink.h"

#include "platform/QVText.h"

#include <array>
#include <string>

// The macro of that name would add the place of this file to every line.
#define SD_JOURNAL_SUPPRESS_LOCATION
#include <systemd/sd-journal.h>

QVJournalLogSink::QVJournalLogSink() : send_(sd_journal_sendv) {}

void QVJournalLogSink::write(std::span<const QVLogLine> lines, const std::atomic<bool>& giveUp) {
  for (const QVLogLine& line : lines) {
    if (giveUp) return;
    std::string message = "MESSAGE=";
    QVAppendLogText(message, line.text);
    std::array<std::string, 7> fields{
        std::move(message),
        QVText("PRIORITY=", static_cast<int>(line.level)),
        QVText("CODE_FILE=", line.file),
        QVText("CODE_LINE=", line.line),
        QVText("CODE_FUNC=", line.function),
        QVText("QV_SCOPE=", line.scopeName()),
        line.scope == nullptr ? std::string() : QVText("QV_SUBSYSTEM=", line.scope->subsystem)};
    std::array<iovec, fields.size()> parts{};
    for (std::size_t i = 0; i < fields.size(); ++i) parts[i] = {fields[i].data(), fields[i].size()};
    const int count = static_cast<int>(line.scope == nullptr ? parts.size() - 1 : parts.size());
    // A line that the journal does not take is lost: there is no other place to say so.
    static_cast<void>(send_(parts.data(), count));
  }
}

bool QVIsJournalStream(const char* journalStream, dev_t device, ino_t inode) {
  return journalStream != nullptr && journalStream == QVText(device, ':', inode);
}
