#include "tools/qvctl/QVSummaryFile.h"

#include "platform/QVText.h"
#include "platform/linux/files/QVJSONFile.h"
#include "platform/linux/files/QVRegularFile.h"
#include "tools/qvctl/QVToolFailure.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cmath>
#include <string_view>
#include <system_error>

namespace {

constexpr std::string_view kMiddle = "-quietvox-";
constexpr std::string_view kEnd = ".json";
constexpr std::size_t kDateBytes = std::string_view("20261116-061300+0000").size();

// The key that the summary event, and no other message, begins with.
constexpr std::string_view kSummaryKey = "QV_Session_Summary_Event";

bool isSummaryName(std::string_view name) {
  return name.ends_with(kEnd) && name.find(kMiddle) == kDateBytes;
}

}  // namespace

QVSummaryFile::QVSummaryFile(std::filesystem::path path) : path_(std::move(path)) {
  std::error_code gone;
  const auto size = std::filesystem::file_size(path_, gone);
  bytes_ = gone ? 0 : size;
  const std::string file = path_.filename().string();
  if (!isSummaryName(file)) return;
  date_ = file.substr(0, kDateBytes);
  const std::string_view rest = std::string_view(file).substr(kDateBytes + kMiddle.size());
  const std::string_view names = rest.substr(0, rest.size() - kEnd.size());
  // Service types' names have no "-".
  const std::size_t dash = names.rfind('-');
  if (dash == std::string_view::npos) return;
  application_ = names.substr(0, dash);
  service_ = names.substr(dash + 1);
}

std::string QVSummaryFile::dateText() const {
  if (date_.empty()) return {};
  const auto part = [this](std::size_t from, std::size_t count) {
    return date_.substr(from, count);
  };
  return QVText(part(0, 4), "-", part(4, 2), "-", part(6, 2), " ", part(9, 2), ":", part(11, 2),
                ":", part(13, 2), " ", part(15, 5));
}

std::vector<QVSummaryFile> QVSummaryFile::list(const std::filesystem::path& directory) {
  std::vector<std::pair<std::filesystem::file_time_type, std::filesystem::path>> found;
  std::error_code error;
  std::filesystem::directory_iterator entries(directory, error);
  for (; !error && entries != std::filesystem::directory_iterator(); entries.increment(error)) {
    if (!isSummaryName(entries->path().filename().string())) continue;
    std::error_code gone;
    const auto time = std::filesystem::last_write_time(entries->path(), gone);
    if (!gone) found.emplace_back(time, entries->path());
  }
  if (error && error != std::errc::no_such_file_or_directory) {
    throw QVToolFailure::ofSystem(directory.string(), error.value());
  }
  std::ranges::sort(found, std::ranges::greater());
  std::vector<QVSummaryFile> files;
  for (const auto& [time, path] : found) files.push_back(QVSummaryFile(path));
  return files;
}

QVSummaryFile QVSummaryFile::choose(const std::filesystem::path& directory,
                                    const std::string& word) {
  if (word.find('/') != std::string::npos) return QVSummaryFile(word);
  const std::vector<QVSummaryFile> files = list(directory);
  std::size_t place = 0;
  const char* const end = word.data() + word.size();
  const auto [stop, problem] = std::from_chars(word.data(), end, place);
  const bool isPlace = problem == std::errc() && stop == end;
  if (word.empty() || isPlace) {
    if (word.empty()) place = 1;
    if (place >= 1 && place <= files.size()) return files[place - 1];
    throw QVToolFailure(QVToolStatus::failed,
                        QVText(directory.string(), ": there are ", files.size(), " summaries"));
  }
  const auto named = std::ranges::find_if(
      files, [&word](const QVSummaryFile& file) { return file.path_.filename() == word; });
  if (named != files.end()) return *named;
  throw QVToolFailure(QVToolStatus::failed,
                      QVText(directory.string(), ": there is no summary ", word));
}

std::string QVSummaryFile::text() const {
  const QVRegularFile file(path_.string(), QVRegularFile::Links::follow);
  std::string text;
  const int error = file.error() != 0 ? file.error() : file.read(kMaximumBytes, text);
  if (error == EACCES) throw QVToolFailure::ofSystem(path_.string(), error);
  if (error != 0) {
    throw QVToolFailure(QVToolStatus::failed,
                        QVText(path_.string(), ": ", QVRegularFile::reason(error, kMaximumBytes)));
  }
  return text;
}

QVArray QVSummaryFile::contents() const {
  QVJSONFailure failure;
  const auto value = QVJSONFile::parse(text(), failure);
  if (!value || value->kind() != QVValue::Kind::array) {
    const std::string reason = value ? "no JSON array" : failure.description();
    throw QVToolFailure(QVToolStatus::failed, QVText(path_.string(), ": ", reason));
  }
  return value->array();
}

QVSummaryFile::Columns QVSummaryFile::columns(const QVArray& contents) {
  Columns columns;
  // The first entry is the session's configuration.
  for (std::size_t i = 1; i < contents.size(); ++i) {
    if (contents[i].kind() != QVValue::Kind::dictionary) continue;
    for (const auto& [identifier, message] : contents[i].dictionary()) {
      if (message.kind() != QVValue::Kind::dictionary) continue;
      const QVDictionary entries = message.dictionary();
      if (entries.contains(kSummaryKey)) continue;
      ++columns.messages;
      for (const auto& [key, value] : entries) {
        if (!value.isNumber() || !std::isfinite(value.doubleValue())) continue;
        columns.byKey[std::string(key)].emplace_back(columns.messages, value.doubleValue());
      }
    }
  }
  return columns;
}
