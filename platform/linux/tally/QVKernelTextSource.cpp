#include "platform/linux/tally/QVKernelTextSource.h"

#include "platform/linux/QVRegularFile.h"
#include "platform/linux/tally/QVKernelText.h"

int QVKernelTextSource::read(QVChannelReadings& readings) const {
  // The administrator named it; much of what the kernel shows is reached through links.
  const QVRegularFile file(description_.file, QVRegularFile::Links::follow);
  if (file.error() != 0) return file.error();
  if (const int error = file.read(QVKernelText::kMaximumBytes, readings.text)) return error;
  readings.subgroups.emplace_back(description_.subgroup);
  std::string_view rest = readings.text;
  while (const auto line = QVKernelText::takeLine(rest)) addChannels(*line, readings);
  return 0;
}

void QVKernelTextSource::addChannels(std::string_view line, QVChannelReadings& readings) const {
  const auto counter = QVKernelText::parseLine(line);
  if (!counter) return;
  QVChannelReadings::Channel channel{
      .subgroup = description_.subgroup, .name = counter->key, .value = counter->value};
  if (!description_.channels) {
    readings.channels.push_back(channel);
    return;
  }
  for (const auto& [name, key] : *description_.channels) {
    if (key != counter->key) continue;
    channel.name = name;
    readings.channels.push_back(channel);
  }
}
