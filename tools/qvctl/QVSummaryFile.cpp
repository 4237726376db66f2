#include "tools/qvctl/QVSummaryFile.h"

#include "platform/QVText.h"
#include "platform/linux/files/QVJSONScan.h"
#include "platform/linux/files/QVRegularFile.h"
#include "tools/qvctl/QVDisplayText.h"
#include "tools/qvctl/QVTimeText.h"
#include "tools/qvctl/QVToolFailure.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <chrono>
#include <optional>
#include <system_error>
#include <utility>

#include <unistd.h>

namespace {

constexpr std::string_view kMiddle = "-quietvox-";
constexpr std::string_view kEnd = ".json";
constexpr std::size_t kDateBytes = std::string_view("20261116-061300+0000").size();

// Bytes of a part of the text.
constexpr std::size_t kPartBytes = std::size_t{64} << 10;

bool isSummaryName(std::string_view name) {
  return name.ends_with(kEnd) && name.find(kMiddle) == kDateBytes;
}

// When the file was written; 0 where it has gone.
int64_t writtenAt(const std::filesystem::path& path) {
  std::error_code gone;
  const auto time = std::filesystem::last_write_time(path, gone);
  if (gone) return 0;
  const auto since = std::chrono::file_clock::to_sys(time).time_since_epoch();
  return std::chrono::floor<std::chrono::microseconds>(since).count();
}

QVRegularFile opened(const std::filesystem::path& path) {
  QVRegularFile file(path.string(), QVRegularFile::Links::follow);
  const int error = file.error();
  if (error == 0) return file;
  if (error != QVRegularFile::kIrregular) throw QVToolFailure::ofFile(path, R_OK, error);
  throw QVToolFailure(QVToolStatus::failed,
                      QVText(path.string(), ": ", QVRegularFile::reason(error, 0)));
}

// Why there is no such summary among `count` of them.
QVToolFailure missing(const std::filesystem::path& directory, const std::string& word,
                      std::size_t count) {
  if (count == 0) {
    return {QVToolStatus::failed, QVText("there are no summaries in ", directory.string(),
                                         "; sessions leave them on an internal build alone")};
  }
  return {QVToolStatus::failed, QVText(directory.string(), ": no summary ", word, ": there ",
                                       count == 1 ? "is " : "are ", count)};
}

}  // namespace

QVSummaryFile::QVSummaryFile(std::filesystem::path path) : path_(std::move(path)) {
  std::error_code gone;
  const auto size = std::filesystem::file_size(path_, gone);
  bytes_ = gone ? 0 : size;
  const std::string file = path_.filename().string();
  const std::string_view name = file;
  const bool isNamed = isSummaryName(name);
  const auto date = isNamed ? QVParseStamp(name.substr(0, kDateBytes)) : std::nullopt;
  stopped_ = date ? *date : writtenAt(path_);
  if (!isNamed) return;
  const std::string_view rest = name.substr(kDateBytes + kMiddle.size());
  const std::string_view names = rest.substr(0, rest.size() - kEnd.size());
  // Service types' names have no "-".
  const std::size_t dash = names.rfind('-');
  if (dash == std::string_view::npos) return;
  application_ = names.substr(0, dash);
  service_ = names.substr(dash + 1);
}

std::vector<QVSummaryFile> QVSummaryFile::list(const std::filesystem::path& directory) {
  std::vector<QVSummaryFile> files;
  std::error_code error;
  std::filesystem::directory_iterator entries(directory, error);
  for (; !error && entries != std::filesystem::directory_iterator(); entries.increment(error)) {
    // Sessions leave no links, and one of another system would lead into this one.
    std::error_code gone;
    if (entries->is_symlink(gone) || !isSummaryName(entries->path().filename().string())) continue;
    files.push_back(QVSummaryFile(entries->path()));
  }
  if (error && error != std::errc::no_such_file_or_directory) {
    throw QVToolFailure::ofFile(directory, R_OK | X_OK, error.value());
  }
  std::ranges::sort(files, std::ranges::greater(), [](const QVSummaryFile& file) {
    return std::pair(file.stopped_, file.path_.native());
  });
  return files;
}

QVSummaryFile QVSummaryFile::choose(const std::filesystem::path& directory,
                                    const std::string& word) {
  if (word.find('/') != std::string::npos) return QVSummaryFile(word);
  const std::vector<QVSummaryFile> files = list(directory);
  std::size_t place = word.empty() ? 1 : 0;
  const char* const end = word.data() + word.size();
  const auto [stop, problem] = std::from_chars(word.data(), end, place);
  const bool isPlace = word.empty() || (problem == std::errc() && stop == end);
  const auto chosen =
      isPlace ? files.begin() + static_cast<std::ptrdiff_t>(std::min(place - 1, files.size()))
              : std::ranges::find_if(files, [&word](const QVSummaryFile& file) {
                  return file.path_.filename() == word;
                });
  if (chosen != files.end()) return *chosen;
  throw missing(directory, word, files.size());
}

void QVSummaryFile::scan(QVJSONReceiver& receiver) const {
  QVJSONFailure failure;
  if (QVScanJSONArray(opened(path_), receiver, failure)) return;
  throw QVToolFailure(QVToolStatus::failed, QVText(path_.string(), ": ", failure.description()));
}

void QVSummaryFile::check() const {
  QVJSONReceiver nobody;
  scan(nobody);
}

void QVSummaryFile::read(const std::function<void(std::string_view part)>& receiver) const {
  const QVRegularFile file = opened(path_);
  std::string part;
  uint64_t offset = 0;
  while (true) {
    const int error = file.readPart(offset, kPartBytes, part);
    if (error != 0) throw QVToolFailure::ofSystem(path_.string(), error);
    if (part.empty()) return;
    // What is cut off is read again; at the file's end there is nothing that it could go on with.
    const std::size_t whole = part.size() < kPartBytes ? part.size() : QVWholeCharacters(part);
    receiver(std::string_view(part).substr(0, whole));
    offset += whole;
  }
}
