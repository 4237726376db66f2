#include "tools/qvctl/QVChannelTable.h"

#include "platform/QVText.h"
#include "platform/linux/files/QVRegularFile.h"
#include "platform/linux/tally/QVChannelConfiguration.h"
#include "platform/linux/tally/QVMMVFormat.h"
#include "platform/linux/tally/QVMMVSource.h"
#include "platform/linux/tally/QVPublishedTally.h"
#include "tools/qvctl/QVToolFailure.h"
#include "tools/qvctl/QVToolLog.h"

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <limits>
#include <memory>
#include <set>
#include <system_error>

#include <unistd.h>

namespace {

// A driver that began anew may have counted less than before.
int64_t difference(int64_t later, int64_t earlier) {
  int64_t result = 0;
  if (!__builtin_sub_overflow(later, earlier, &result)) return result;
  return later < 0 ? std::numeric_limits<int64_t>::min() : std::numeric_limits<int64_t>::max();
}

// Why a file cannot be read.
std::string reasonOf(int error) {
  if (error == EBADMSG) return "not a file of channels";
  if (error == EAGAIN) return "being written";
  return QVRegularFile::reason(error, QVMMVFormat::kMaximumBytes);
}

}  // namespace

struct QVChannelTable::File {
  std::string path;
  std::unique_ptr<const QVChannelSource> source;
  bool isListed = false;  // the directory had it, so where it is gone there is nothing to say

  void addTo(Reading& reading) const {
    QVChannelReadings readings;
    if (const int error = source->read(readings)) {
      if (!isListed || error != ENOENT) reading.unreadable.push_back({path, reasonOf(error)});
      return;
    }
    for (const auto& channel : readings.channels) {
      if (reading.channels.size() >= QVPublishedTally::kMaximumChannels) return;
      reading.channels.push_back({.group = source->group(),
                                  .subgroup = std::string(channel.subgroup.value_or("")),
                                  .name = std::string(channel.name),
                                  .value = channel.value,
                                  .growth = {}});
    }
  }
};

std::vector<std::string> QVChannelTable::publishedGroups() const {
  std::vector<std::string> names;
  const std::filesystem::path directory = places_.directories.channels();
  std::error_code error;
  std::filesystem::directory_iterator entries(directory, error);
  for (; !error && entries != std::filesystem::directory_iterator(); entries.increment(error)) {
    const std::string name = entries->path().filename().string();
    const bool isGroup = !name.starts_with('.');
    if (isGroup && names.size() < QVPublishedTally::kMaximumFiles) names.push_back(name);
  }
  // Without the directory nobody has published.
  if (error && error != std::errc::no_such_file_or_directory) {
    throw QVToolFailure::ofFile(directory, R_OK | X_OK, error.value());
  }
  std::ranges::sort(names);
  return names;
}

std::vector<QVChannelTable::File> QVChannelTable::files(Reading& reading) const {
  std::vector<File> files;
  const std::filesystem::path directory = places_.directories.channels();
  for (const std::string& name : publishedGroups()) {
    files.push_back({.path = (directory / name).string(),
                     .source = std::make_unique<QVMMVSource>(directory.string(), name),
                     .isListed = true});
  }
  QVToolLog log;
  const std::string configuration = places_.directories.channelConfiguration().string();
  for (const auto& description : QVChannelConfiguration::read(log, configuration)) {
    files.push_back(
        {.path = description.file, .source = std::make_unique<QVKernelTextSource>(description)});
  }
  for (const std::string& error : log.errors()) {
    reading.unreadable.push_back({configuration, error});
  }
  return files;
}

void QVChannelTable::selectGroup(std::vector<File>& files) const {
  std::set<std::string> groups;
  for (const File& file : files) groups.insert(file.source->group());
  std::erase_if(files, [this](const File& file) { return file.source->group() != group_; });
  // One that was there may come back.
  if (!files.empty() || !isFirst_) return;
  std::string text = QVText("no group is called \"", group_, "\"; ");
  if (groups.empty()) text.append("nobody publishes");
  for (const std::string& group : groups) {
    text.append(group == *groups.begin() ? "there are " : ", ").append(group);
  }
  throw QVToolFailure(QVToolStatus::failed, text);
}

QVChannelTable::Reading QVChannelTable::read() {
  Reading reading;
  std::vector<File> found = files(reading);
  if (!group_.empty()) selectGroup(found);
  for (const File& file : found) file.addTo(reading);
  addGrowth(reading.channels);
  isFirst_ = false;
  return reading;
}

void QVChannelTable::addGrowth(std::vector<Channel>& channels) {
  std::map<Key, int64_t> values;
  for (Channel& channel : channels) {
    if (!channel.value) continue;
    Key key{channel.group, channel.subgroup, channel.name, 0};
    while (values.contains(key)) ++std::get<std::size_t>(key);
    const auto before = earlier_.find(key);
    if (before != earlier_.end()) channel.growth = difference(*channel.value, before->second);
    values.emplace(std::move(key), *channel.value);
  }
  earlier_ = std::move(values);
}
