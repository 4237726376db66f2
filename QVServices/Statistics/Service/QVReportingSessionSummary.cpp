// How a QVReportingSession sums up what it recorded: in an event, and in a file.

#include "QVServices/Statistics/QVReportingUtility.h"
#include "QVServices/Statistics/QVReportingVocabulary.h"
#include "QVServices/Statistics/Service/QVReportingSession.h"
#include "QVServices/Statistics/Service/QVReportingSessionLog.h"
#include "platform/QVPlatform.h"

#include <algorithm>
#include <chrono>
#include <cstdlib>
#include <map>
#include <utility>
#include <vector>

namespace {

constexpr std::string_view kSummaryDirectory = "/DiagnosticLogs/Audio/Reporting";
// On an internal build everybody may list the files and clear them away.
constexpr uint32_t kSummaryDirectoryPermissions = 0777;

QVPlatform& platform() {
  return QVPlatform::shared();
}

// The texts of each key's values, joined with commas.
class Columns {
 public:
  void add(std::string_view key, const QVValue& value) { append(columnOf(key), value); }

  void add(const QVReportingPayloadArray::Payload& payload) {
    if (payload.keySet == 0) {
      for (const auto& [key, value] : payload.entries) add(key, value);
      return;
    }
    // Names are looked up once for each set of keys, not with each message.
    if (known_.size() <= payload.keySet) known_.resize(payload.keySet + 1);
    std::vector<Column*>& columns = known_[payload.keySet];
    if (columns.empty()) {
      for (const auto& entry : payload.entries) columns.push_back(&columnOf(entry.key));
    }
    for (std::size_t i = 0; i < columns.size(); ++i) append(*columns[i], payload.entries[i].value);
  }

  QVDictionary joined() const {
    std::vector<QVDictionaryEntry> entries;
    entries.reserve(columns_.size());
    for (const auto& [key, column] : columns_) {
      entries.push_back({key, QVValue::borrowing(column.text)});
    }
    return QVDictionary::assemble(entries);
  }

 private:
  struct Column {
    std::string text;
    bool begun = false;  // the first value's text may be empty
  };

  Column& columnOf(std::string_view key) {
    const auto known = columns_.find(key);
    return known != columns_.end() ? known->second : columns_[std::string(key)];
  }

  static void append(Column& column, const QVValue& value) {
    if (std::exchange(column.begun, true)) column.text += ',';
    QVAppendText(column.text, value);
  }

  std::map<std::string, Column, std::less<>> columns_;
  std::vector<std::vector<Column*>> known_;  // by set of keys, in the order of the keys
};

void appendDigits(std::string& out, int64_t number, std::size_t width) {
  const std::string digits = QVText(number);
  out.append(width - std::min(width, digits.size()), '0').append(digits);
}

// "20261116-061300+0000": the date at a place whose time is so far ahead of UTC.
std::string dateText(QVDate date, std::chrono::seconds offset) {
  namespace chrono = std::chrono;
  const auto local = chrono::floor<chrono::seconds>(date) + offset;
  const auto day = chrono::floor<chrono::days>(local);
  const chrono::year_month_day calendar(day);
  const chrono::hh_mm_ss time(local - day);
  const int64_t ahead = chrono::duration_cast<chrono::minutes>(offset).count();

  std::string text;
  appendDigits(text, int{calendar.year()}, 4);
  appendDigits(text, unsigned{calendar.month()}, 2);
  appendDigits(text, unsigned{calendar.day()}, 2);
  text += '-';
  appendDigits(text, time.hours().count(), 2);
  appendDigits(text, time.minutes().count(), 2);
  appendDigits(text, time.seconds().count(), 2);
  text += ahead < 0 ? '-' : '+';
  appendDigits(text, std::abs(ahead) / 60, 2);
  appendDigits(text, std::abs(ahead) % 60, 2);
  return text;
}

// The application's name is the client's, which must not choose the directory with it.
std::string applicationPart(const QVDictionary& userInfo) {
  const QVValue* const application = userInfo.find(kQVReportingHostApplicationKey);
  if (application == nullptr) return "unknown";
  std::string text = QVText(*application);
  std::ranges::replace_if(
      text, [](char c) { return c == '/' || c == '\0'; }, '_');
  return text;
}

// Writes the user information, and behind it every recorded message under its identifier. Answers
// why that cannot be; the file is of no use then.
std::optional<QVError> serialise(QVReportingPayloadArray& recorded, const QVDictionary& userInfo,
                                 QVAtomicFile& file) {
  const auto stream =
      platform().jsonOutput->makeArrayStream([&file](std::string_view text) { file.write(text); });
  std::optional<QVError> error;
  const std::lock_guard lock(recorded);
  recorded.insertAtFront(userInfo);
  recorded.forEach([&stream, &error](std::string_view identifier,
                                     const QVReportingPayloadArray::Payload& payload) {
    if (error) return;
    error = identifier.empty() ? stream->append(payload.entries)
                               : stream->append(identifier, payload.entries);
  });
  if (!error) stream->end();
  return error;
}

}  // namespace

QVDictionary QVReportingSession::createSummaryEventForSession() const {
  const auto recorded = aggregatedPayloadData();
  if (recorded == nullptr || recorded->empty()) return {};

  Columns columns;
  columns.add(kQVReportingSummaryEventKey, serviceType());
  recorded->forEach([&columns](std::string_view, const QVReportingPayloadArray::Payload& payload) {
    columns.add(payload);
  });
  return columns.joined();
}

void QVReportingSession::writeSummaryJson() {
  constexpr const char* kFunction = "-[QVReportingSession writeSummaryJson]";
  if (!QVReportingIsInternalBuild()) return;
  const auto recorded = nestedAggregatedPayloadData();
  if (recorded == nullptr || recorded->empty()) return;

  QVLog& log = *platform().log;
  const QVLogScope* const scope = QVReportingSessionLog::scope();
  QVFileSystem& files = *platform().fileSystem;
  const QVDictionary userInfo = this->userInfo();
  const QVDate date = platform().clock->currentDate();

  // The file is open before there is anything to write, as it takes the text while that comes to
  // be. What goes wrong is told in the order in which a whole text would be made, then written.
  const std::string directory = QVText(files.diagnosticLogRoot(), kSummaryDirectory);
  const std::optional<QVError> directoryError =
      files.createDirectory(directory, kSummaryDirectoryPermissions);
  std::unique_ptr<QVAtomicFile> file = files.makeAtomicFile(
      QVText(directory, '/', dateText(date, platform().clock->offsetFromUTC(date)), "-quietvox-",
             applicationPart(userInfo), '-', serviceName_, ".json"));
  if (const auto error = serialise(*recorded, userInfo, *file)) {
    log.error(scope, kFunction, "dataWithJSONObject: ", error->description());
    file.reset();
  }
  if (directoryError) {
    log.error(scope, kFunction, "can't create logging directory at ", directory, ": ",
              directoryError->description());
  }
  if (file == nullptr) return;
  if (const auto error = file->commit()) {
    log.error(scope, kFunction, "jsonOutput writeToURL: ", error->description());
  }
}
