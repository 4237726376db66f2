#include "tools/qvctl/QVChannelTable.h"

#include "platform/QVText.h"
#include "platform/linux/tally/QVChannelConfiguration.h"
#include "platform/linux/tally/QVMMVSource.h"
#include "platform/linux/tally/QVPublishedTally.h"
#include "tools/qvctl/QVToolFailure.h"
#include "tools/qvctl/QVToolLog.h"
#include "tools/qvctl/QVToolOutput.h"

#include <algorithm>
#include <filesystem>
#include <limits>
#include <memory>
#include <system_error>

namespace {

// A driver that began anew may have counted less than before.
int64_t difference(int64_t later, int64_t earlier) {
  int64_t result = 0;
  if (!__builtin_sub_overflow(later, earlier, &result)) return result;
  return later < 0 ? std::numeric_limits<int64_t>::min() : std::numeric_limits<int64_t>::max();
}

void addChannels(const QVChannelSource& source, QVChannelTable::Channels& channels) {
  QVChannelReadings readings;
  if (const int error = source.read(readings)) {
    QVToolOutput::note(QVText(source.group(), ": ", std::generic_category().message(error)));
    return;
  }
  for (const auto& channel : readings.channels) {
    if (channels.size() >= QVPublishedTally::kMaximumChannels) return;
    channels.push_back({.group = source.group(),
                        .subgroup = std::string(channel.subgroup.value_or("")),
                        .name = std::string(channel.name),
                        .value = channel.value,
                        .growth = {}});
  }
}

}  // namespace

std::vector<std::string> QVChannelTable::publishedGroups() const {
  std::vector<std::string> names;
  const std::filesystem::path directory = places_.directories.channels();
  std::error_code error;
  std::filesystem::directory_iterator entries(directory, error);
  for (; !error && entries != std::filesystem::directory_iterator(); entries.increment(error)) {
    const std::string name = entries->path().filename().string();
    const bool isOne = !name.starts_with('.') && (group_.empty() || name == group_);
    if (isOne && names.size() < QVPublishedTally::kMaximumFiles) names.push_back(name);
  }
  // Without the directory nobody has published.
  if (error && error != std::errc::no_such_file_or_directory) {
    throw QVToolFailure::ofSystem(directory.string(), error.value());
  }
  std::ranges::sort(names);
  return names;
}

QVChannelTable::Channels QVChannelTable::read() {
  Channels channels;
  for (const std::string& name : publishedGroups()) {
    addChannels(QVMMVSource(places_.directories.channels().string(), name), channels);
  }
  QVToolLog log;
  const std::string configuration = places_.directories.channelConfiguration().string();
  for (const auto& description : QVChannelConfiguration::read(log, configuration)) {
    if (!group_.empty() && description.group != group_) continue;
    addChannels(QVKernelTextSource(description), channels);
  }
  addGrowth(channels);
  return channels;
}

void QVChannelTable::addGrowth(Channels& channels) {
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
