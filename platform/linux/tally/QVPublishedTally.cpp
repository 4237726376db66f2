#include "platform/linux/tally/QVPublishedTally.h"

#include "platform/QVText.h"
#include "platform/linux/tally/QVChannelConfiguration.h"
#include "platform/linux/tally/QVMMVSource.h"

#include <algorithm>
#include <cerrno>
#include <compare>
#include <cstdint>
#include <filesystem>
#include <limits>
#include <map>
#include <string_view>
#include <system_error>
#include <tuple>
#include <utility>

// The sources are kept, to be read again.
class QVPublishedTally::ChannelSet final : public TallyChannelSet {
 public:
  struct Channel {
    std::size_t source;  // in `sources`
    std::optional<std::string> subgroup;
    std::string name;     // empty where it has none
    uint32_t occurrence;  // among those of the source with the same subgroup and name
  };

  ChannelSet(Sources from, std::vector<Channel> members)
      : sources(std::move(from)), channels(std::move(members)) {}

  const std::string& group(const Channel& channel) const {
    return sources[channel.source]->group();
  }

  const Sources sources;
  const std::vector<Channel> channels;
};

class QVPublishedTally::Sample final : public TallyChannelSample {
 public:
  Sample(const std::string& channel, int64_t sampled) : name(channel), value(sampled) {}

  const std::string& name;
  const int64_t value;
};

class QVPublishedTally::SampleSet final : public TallySampleSet {
 public:
  explicit SampleSet(std::shared_ptr<const ChannelSet> sampled)
      : channels(std::move(sampled)), values(channels->channels.size()) {}

  const std::shared_ptr<const ChannelSet> channels;
  std::vector<std::optional<int64_t>> values;  // of each channel, none where it is left out
};

namespace {

// Keeps the first thing that went wrong.
void note(QVTally::Error& error, int code, std::string_view where) {
  if (error) return;
  const std::string reason = QVText(where, ": ", std::generic_category().message(code));
  error = QVError{.domain = QVTally::kErrorDomain,
                  .code = code,
                  .userInfo = QVDictionary{{QVError::kFailureReason, reason}}};
}

// May a file have this name, and be a group's?
bool canBeGroup(std::string_view name) {
  using namespace std::string_view_literals;
  return !name.empty() && name.front() != '.' &&
         name.find_first_of("/\0"sv) == std::string_view::npos;
}

bool matches(const QVTally::Name& asked, const std::optional<std::string_view>& published) {
  return !asked || (published && *asked == *published);
}

int64_t saturatedDifference(int64_t later, int64_t earlier) {
  using Limits = std::numeric_limits<int64_t>;
  int64_t difference = 0;
  if (!__builtin_sub_overflow(later, earlier, &difference)) return difference;
  return later < earlier ? Limits::min() : Limits::max();
}

// Numbers equal channels, from 0, in the order in which they come.
template <class Key>
class Occurrences {
 public:
  uint32_t next(const Key& key) { return counts_[key]++; }

 private:
  std::map<Key, uint32_t> counts_;
};

// What makes two channels equal within a source, and within a set.
using SourceKey = std::pair<std::optional<std::string_view>, std::string_view>;
using SetKey = std::tuple<std::string_view, std::optional<std::string_view>, std::string_view>;

// The values of a source's readings by channel.
class Lookup {
 public:
  explicit Lookup(const QVChannelReadings& readings) {
    Occurrences<SourceKey> occurrences;
    for (const auto& channel : readings.channels) {
      const SourceKey key(channel.subgroup, channel.name);
      values_.emplace(std::pair(key, occurrences.next(key)), channel.value);
    }
  }
  std::optional<int64_t> value(const SourceKey& key, uint32_t occurrence) const {
    const auto found = values_.find(std::pair(key, occurrence));
    return found == values_.end() ? std::nullopt : found->second;
  }

 private:
  std::map<std::pair<SourceKey, uint32_t>, std::optional<int64_t>> values_;
};

}  // namespace

QVPublishedTally::QVPublishedTally(QVLog& log, std::string directory,
                                   const std::string& configuration)
    : directory_(std::move(directory)) {
  for (auto& description : QVChannelConfiguration::read(log, configuration)) {
    kernelSources_.push_back(std::make_shared<QVKernelTextSource>(std::move(description)));
  }
}

QVPublishedTally::~QVPublishedTally() = default;

std::vector<std::string> QVPublishedTally::publishedNames(Error& error) const {
  std::vector<std::string> names;
  std::error_code failure;
  std::filesystem::directory_iterator entry(directory_, failure);
  std::size_t looked = 0;
  while (!failure && entry != std::filesystem::directory_iterator()) {
    if (++looked > kMaximumFiles) {
      failure = std::make_error_code(std::errc::argument_list_too_long);
      break;
    }
    std::string name = entry->path().filename().string();
    if (canBeGroup(name)) names.push_back(std::move(name));
    entry.increment(failure);
  }
  // Before the first driver, there need not be a directory.
  if (failure && failure != std::errc::no_such_file_or_directory) {
    note(error, failure.value(), directory_);
  }
  std::ranges::sort(names);
  return names;
}

QVPublishedTally::Sources QVPublishedTally::sources(const Name& group, Error& error) const {
  std::vector<std::string> names;
  if (!group) {
    names = publishedNames(error);
  } else if (canBeGroup(*group)) {
    names.push_back(*group);
  }
  Sources sources;
  for (std::string& name : names) {
    sources.push_back(std::make_shared<QVMMVSource>(directory_, std::move(name)));
  }
  for (const auto& source : kernelSources_) {
    if (!group || *group == source->group()) sources.push_back(source);
  }
  return sources;
}

std::shared_ptr<const TallyChannelSet> QVPublishedTally::TallyCopyChannelsInGroup(
    const Name& group, const Name& subgroup, uint64_t /*options*/, Error& error) {
  Sources all = sources(group, error);
  bool published = false;
  std::vector<ChannelSet::Channel> channels;
  for (std::size_t source = 0; source < all.size(); ++source) {
    QVChannelReadings readings;
    if (const int code = all[source]->read(readings)) {
      if (code != ENOENT) note(error, code, all[source]->group());
      continue;
    }
    published = published || std::ranges::any_of(readings.subgroups, [&](const auto& name) {
                  return matches(subgroup, name);
                });
    Occurrences<SourceKey> occurrences;
    for (const auto& channel : readings.channels) {
      const uint32_t occurrence = occurrences.next({channel.subgroup, channel.name});
      if (!matches(subgroup, channel.subgroup)) continue;
      if (channels.size() == kMaximumChannels) {
        note(error, E2BIG, all[source]->group());
        break;
      }
      channels.push_back({.source = source,
                          .subgroup = std::optional<std::string>(channel.subgroup),
                          .name = std::string(channel.name),
                          .occurrence = occurrence});
    }
  }
  if (!published) return nullptr;
  std::ranges::stable_sort(channels, [&all](const auto& one, const auto& other) {
    return std::tie(all[one.source]->group(), one.subgroup) <
           std::tie(all[other.source]->group(), other.subgroup);
  });
  return std::make_shared<ChannelSet>(std::move(all), std::move(channels));
}

int32_t QVPublishedTally::TallyGetChannelCount(const TallyChannelSet& channels) {
  return static_cast<int32_t>(static_cast<const ChannelSet&>(channels).channels.size());
}

std::shared_ptr<TallySubscription> QVPublishedTally::TallyCreateSubscription(
    const TallyChannelSet& channels, std::shared_ptr<const TallyChannelSet>& subscribed) {
  // Files are not told who reads them: there is nothing that a subscription would hold.
  class Subscription final : public TallySubscription {};
  const auto& set = static_cast<const ChannelSet&>(channels);
  subscribed = std::make_shared<ChannelSet>(set.sources, set.channels);
  return std::make_shared<Subscription>();
}

std::shared_ptr<const TallySampleSet> QVPublishedTally::TallyCreateSamples(
    const std::shared_ptr<TallySubscription>& subscription,
    const std::shared_ptr<const TallyChannelSet>& subscribed, Error& error) {
  if (subscription == nullptr || subscribed == nullptr) {
    note(error, EINVAL, "no subscription");
    return nullptr;
  }
  const auto set = std::static_pointer_cast<const ChannelSet>(subscribed);
  std::vector<std::vector<std::size_t>> channelsOfSource(set->sources.size());
  for (std::size_t i = 0; i < set->channels.size(); ++i) {
    channelsOfSource[set->channels[i].source].push_back(i);
  }
  auto samples = std::make_shared<SampleSet>(set);
  for (std::size_t source = 0; source < set->sources.size(); ++source) {
    if (channelsOfSource[source].empty()) continue;
    QVChannelReadings readings;
    if (const int code = set->sources[source]->read(readings)) {
      // A publisher that is gone takes its own channels with it, and nobody else's.
      if (code != ENOENT) note(error, code, set->sources[source]->group());
      continue;
    }
    const Lookup lookup(readings);
    for (const std::size_t i : channelsOfSource[source]) {
      const ChannelSet::Channel& channel = set->channels[i];
      samples->values[i] = lookup.value({channel.subgroup, channel.name}, channel.occurrence);
    }
  }
  return samples;
}

std::shared_ptr<const TallySampleSet> QVPublishedTally::TallyCreateSamplesDelta(
    const std::shared_ptr<const TallySampleSet>& earlier, const TallySampleSet& later,
    Error& /*error*/) {
  if (earlier == nullptr) return nullptr;
  // Calls `each` with a channel's key, its place among equal ones, and its value.
  const auto walk = [](const SampleSet& samples, const auto& each) {
    const ChannelSet& set = *samples.channels;
    Occurrences<SetKey> occurrences;
    for (std::size_t i = 0; i < set.channels.size(); ++i) {
      const ChannelSet::Channel& channel = set.channels[i];
      const SetKey key(set.group(channel), channel.subgroup, channel.name);
      each(std::pair(key, occurrences.next(key)), i, samples.values[i]);
    }
  };
  std::map<std::pair<SetKey, uint32_t>, std::optional<int64_t>> before;
  walk(static_cast<const SampleSet&>(*earlier),
       [&before](const auto& key, std::size_t, const auto& value) { before.emplace(key, value); });

  const auto& after = static_cast<const SampleSet&>(later);
  auto differences = std::make_shared<SampleSet>(after.channels);
  walk(after, [&](const auto& key, std::size_t i, const auto& value) {
    const auto found = before.find(key);
    if (found == before.end() || !found->second || !value) return;
    differences->values[i] = saturatedDifference(*value, *found->second);
  });
  return differences;
}

void QVPublishedTally::TallyIterate(const TallySampleSet& samples, Iterator iterator) {
  const auto& set = static_cast<const SampleSet&>(samples);
  for (std::size_t i = 0; i < set.values.size(); ++i) {
    if (!set.values[i]) continue;
    if (iterator(Sample(set.channels->channels[i].name, *set.values[i])) != 0) return;
  }
}

int64_t QVPublishedTally::TallySimpleGetIntegerValue(const TallyChannelSample& sample) {
  return static_cast<const Sample&>(sample).value;
}

QVTally::Name QVPublishedTally::TallyChannelGetChannelName(const TallyChannelSample& sample) {
  const std::string& name = static_cast<const Sample&>(sample).name;
  return name.empty() ? Name() : Name(name);
}
