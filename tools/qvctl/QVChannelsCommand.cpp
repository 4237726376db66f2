#include "tools/qvctl/QVChannelsCommand.h"

#include "platform/QVText.h"
#include "tools/qvctl/QVEnding.h"
#include "tools/qvctl/QVTable.h"
#include "tools/qvctl/QVTimeText.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <optional>
#include <utility>
#include <vector>

#include <poll.h>

namespace {

using Clock = std::chrono::steady_clock;

// Shorter intervals show nothing more, and longer ones are not waited for at once.
constexpr std::chrono::milliseconds kShortest{10};
constexpr std::chrono::hours kLongest{24};

std::chrono::milliseconds intervalOf(const std::string& text) {
  const auto duration = QVParseDuration(text);
  if (!duration || *duration < kShortest || *duration > kLongest) {
    throw QVToolFailure(QVToolStatus::wrongUsage,
                        QVText("\"", text, "\" is no interval from 10ms to 24h"));
  }
  return std::chrono::ceil<std::chrono::milliseconds>(*duration);
}

// Waits for the next reading; false where that is the end.
bool wait(const QVToolOutput& output, const QVEnding& ending, Clock::time_point until) {
  while (!QVEnding::isAsked()) {
    const auto rest = std::chrono::ceil<std::chrono::milliseconds>(until - Clock::now());
    if (rest.count() <= 0) return true;
    // Of the output, errors are always told: the reader of a pipe has gone away.
    std::array<pollfd, 1> entries{{{output.descriptor(), 0, 0}}};
    const int ready = ending.poll(entries, static_cast<int>(rest.count()));
    if (ready < 0 && errno != EINTR) throw QVToolFailure::ofSystem("waiting", errno);
    if (ready > 0 && (entries[0].revents & POLLERR) != 0) return false;
  }
  return false;
}

std::string rateText(double rate) {
  char text[48];
  std::snprintf(text, sizeof text, "%.1f", rate);
  return text;
}

}  // namespace

QVToolStatus QVChannelsCommand::run(const QVToolContext& context, const Options& options) {
  QVChannelTable table(context.places, options.group);
  if (options.interval.empty()) {
    if (options.count) {
      throw QVToolFailure(QVToolStatus::wrongUsage, "--count goes with --interval");
    }
    const QVChannelTable::Reading reading = table.read();
    complain(reading, {});
    show(context.output, reading, std::nullopt);
    return QVToolStatus::done;
  }
  const auto interval = intervalOf(options.interval);
  const QVEnding ending(std::nullopt);
  std::optional<Clock::time_point> last;
  QVChannelTable::Reading before;
  for (std::size_t round = 0; !options.count || round < *options.count; ++round) {
    if (last && !wait(context.output, ending, *last + interval)) break;
    const auto now = Clock::now();
    std::optional<double> seconds;
    if (last) seconds = std::chrono::duration<double>(now - *last).count();
    last = now;
    if (round > 0 && !context.output.isJSON()) context.output.line("");
    QVChannelTable::Reading reading = table.read();
    complain(reading, before);
    show(context.output, reading, seconds);
    before = std::move(reading);
    context.output.flush();
  }
  return QVToolStatus::done;
}

QVValue QVChannelsCommand::json(const QVChannelTable::Channel& channel,
                                std::optional<double> seconds) {
  QVDictionary entries{
      {"group", channel.group},
      {"subgroup", channel.subgroup.empty() ? QVValue() : QVValue(channel.subgroup)},
      {"channel", channel.name},
      {"value", channel.value ? QVValue(*channel.value) : QVValue()}};
  if (!channel.growth || !seconds) return entries;
  return entries.merging(
      {{"delta", *channel.growth}, {"perSecond", static_cast<double>(*channel.growth) / *seconds}});
}

QVValue QVChannelsCommand::json(const QVChannelTable::Reading& reading,
                                std::optional<double> seconds) {
  std::vector<QVValue> channels;
  for (const auto& channel : reading.channels) channels.push_back(json(channel, seconds));
  std::vector<QVValue> unreadable;
  for (const auto& [path, error] : reading.unreadable) {
    unreadable.emplace_back(QVDictionary{{"path", path}, {"error", error}});
  }
  return QVDictionary{{"channels", QVArray::assemble(channels)},
                      {"unreadable", QVArray::assemble(unreadable)}};
}

void QVChannelsCommand::complain(const QVChannelTable::Reading& reading,
                                 const QVChannelTable::Reading& before) {
  for (const auto& file : reading.unreadable) {
    if (std::ranges::find(before.unreadable, file) != before.unreadable.end()) continue;
    const bool isNamed = file.error.find(file.path) != std::string::npos;
    QVToolOutput::note(isNamed ? file.error : QVText(file.path, ": ", file.error));
  }
}

void QVChannelsCommand::show(QVToolOutput& output, const QVChannelTable::Reading& reading,
                             std::optional<double> seconds) {
  if (output.isJSON()) {
    output.json(json(reading, seconds));
    return;
  }
  std::vector<QVTable::Column> columns{
      {"GROUP"}, {"SUBGROUP"}, {"CHANNEL"}, {"VALUE", QVTable::Align::right}};
  if (seconds) {
    columns.push_back({"DELTA", QVTable::Align::right});
    columns.push_back({"PER SECOND", QVTable::Align::right});
  }
  QVTable table(output, columns);
  for (const auto& channel : reading.channels) {
    QVTable::Row row{channel.group, channel.subgroup.empty() ? "-" : channel.subgroup, channel.name,
                     channel.value ? std::to_string(*channel.value) : "-"};
    if (seconds) {
      row.emplace_back(channel.growth ? QVText(*channel.growth > 0 ? "+" : "", *channel.growth)
                                      : std::string("-"));
      row.emplace_back(channel.growth ? rateText(static_cast<double>(*channel.growth) / *seconds)
                                      : std::string("-"));
    }
    table.add(std::move(row));
  }
  table.print();
}
