#include "platform/linux/tally/QVKernelTextSource.h"

#include "platform/linux/files/QVRegularFile.h"
#include "platform/linux/tally/QVKernelText.h"

#include <utility>

QVKernelTextSource::QVKernelTextSource(Description description)
    : group_(std::move(description.group)),
      subgroup_(std::move(description.subgroup)),
      file_(std::move(description.file)) {
  if (!description.channels) return;
  names_.emplace();
  for (auto& [name, key] : *description.channels) names_->emplace(std::move(key), std::move(name));
}

int QVKernelTextSource::read(QVChannelReadings& readings) const {
  // The administrator named it; much of what the kernel shows is reached through links.
  const QVRegularFile file(file_, QVRegularFile::Links::follow);
  if (file.error() != 0) return file.error();
  if (const int error = file.read(QVKernelText::kMaximumBytes, readings.text)) return error;
  readings.subgroups.emplace_back(subgroup_);
  std::string_view rest = readings.text;
  while (readings.channels.size() <= kMaximumChannels) {
    const auto line = QVKernelText::takeLine(rest);
    if (!line) break;
    addChannels(*line, readings);
  }
  return 0;
}

void QVKernelTextSource::addChannels(std::string_view line, QVChannelReadings& readings) const {
  const auto counter = QVKernelText::parseLine(line);
  if (!counter) return;
  QVChannelReadings::Channel channel{
      .subgroup = subgroup_, .name = counter->key, .value = counter->value};
  if (!names_) {
    readings.channels.push_back(channel);
    return;
  }
  const auto [begin, end] = names_->equal_range(counter->key);
  for (auto named = begin; named != end; ++named) {
    channel.name = named->second;
    readings.channels.push_back(channel);
  }
}
