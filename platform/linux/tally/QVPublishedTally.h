#pragma once

#include "platform/QVLog.h"
#include "platform/QVTally.h"
#include "platform/linux/tally/QVChannelSource.h"

#include <cstddef>
#include <memory>
#include <string>
#include <vector>

// Tally over files: driver processes publish into a directory (see QVMMVFormat), the kernel into
// text files that the configuration names (see QVChannelConfiguration). Made by the composition
// root.
//
// A group or a subgroup is published where a file says so; a published one without channels is an
// empty set, one that is not published no set. Channels come in the order of their groups, then of
// their subgroups, those without one first, then of the files (a driver's before the kernel's) and
// of the places in them.
//
// A sample reads each of its files once. A channel is known again by group, subgroup and name, and
// by its place among equal ones: a publisher may replace its file. A file that is gone is
// left out, without an error; a bad one is an error, whose code is the system's error number. What
// the other files hold comes with it.
//
// Threads: any, at once: it keeps what the configuration said, and nothing else. Names beginning
// with "." are files in the making, and no groups. The log is used in the constructor alone.
class QVPublishedTally final : public QVTally {
 public:
  // Entries of the directory that are looked at; one for each driver, and far above their number.
  static constexpr std::size_t kMaximumFiles = 1024;
  // Channels of a set. What is beyond is left out, with the error E2BIG.
  static constexpr std::size_t kMaximumChannels = QVChannelSource::kMaximumChannels;

  QVPublishedTally(QVLog& log, std::string directory, const std::string& configuration);
  ~QVPublishedTally() override;

  std::shared_ptr<const TallyChannelSet> TallyCopyChannelsInGroup(const Name& group,
                                                                  const Name& subgroup,
                                                                  uint64_t options,
                                                                  Error& error) override;
  int32_t TallyGetChannelCount(const TallyChannelSet& channels) override;
  std::shared_ptr<TallySubscription> TallyCreateSubscription(
      const TallyChannelSet& channels, std::shared_ptr<const TallyChannelSet>& subscribed) override;
  std::shared_ptr<const TallySampleSet> TallyCreateSamples(
      const std::shared_ptr<TallySubscription>& subscription,
      const std::shared_ptr<const TallyChannelSet>& subscribed, Error& error) override;
  std::shared_ptr<const TallySampleSet> TallyCreateSamplesDelta(
      const std::shared_ptr<const TallySampleSet>& earlier, const TallySampleSet& later,
      Error& error) override;
  void TallyIterate(const TallySampleSet& samples, Iterator iterator) override;
  int64_t TallySimpleGetIntegerValue(const TallyChannelSample& sample) override;
  Name TallyChannelGetChannelName(const TallyChannelSample& sample) override;

 private:
  using Sources = std::vector<std::shared_ptr<const QVChannelSource>>;
  class ChannelSet;
  class Sample;
  class SampleSet;

  // The names of the directory's files, in ascending order.
  std::vector<std::string> publishedNames(Error& error) const;
  // The files that may publish the group; absent: any group.
  Sources sources(const Name& group, Error& error) const;

  const std::string directory_;
  Sources kernelSources_;  // constant after construction
};
