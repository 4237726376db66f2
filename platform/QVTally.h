#pragma once

#include "platform/QVError.h"
#include "platform/QVFunction.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

// What Tally hands out is opaque to everyone but the adapter that made it, and immutable once made.

// Channels that were published together.
class TallyChannelSet {
 public:
  virtual ~TallyChannelSet() = default;
};
// What it takes to sample a set's channels.
class TallySubscription {
 public:
  virtual ~TallySubscription() = default;
};
// Values of channels, at one moment or between two.
class TallySampleSet {
 public:
  virtual ~TallySampleSet() = default;
};
// One channel's sample, there while it is iterated over.
class TallyChannelSample {
 public:
  virtual ~TallyChannelSample() = default;
};

// Tally, the library of I/O statistics channels: drivers publish counters as channels, which are
// organised in groups and subgroups. The operations have the library's own names.
//
// Threads: any, at once. A sample costs one read or mapping a file; nothing waits for a publisher.
// Ownership: what is handed out is the caller's, and outlives neither this object nor its
// subscription. A set that another implementation made is a bug of the caller.
// Failures: an operation that fails fills `error`, which it leaves alone else. What publishers
// wrote is foreign: a hostile, torn or vanishing file costs an error, never more.
class QVTally {
 public:
  using Iterator = QVFunction<int(const TallyChannelSample& sample)>;
  using Error = std::optional<QVError>;
  using Name = std::optional<std::string>;

  static constexpr const char* kErrorDomain = "net.quillon.tally";

  virtual ~QVTally() = default;

  // The channels that are published now under the names; an absent name matches all. None where
  // nothing is published under them. `options` is 0. An error may come with a set of what could be
  // read.
  virtual std::shared_ptr<const TallyChannelSet> TallyCopyChannelsInGroup(const Name& group,
                                                                          const Name& subgroup,
                                                                          uint64_t options,
                                                                          Error& error) = 0;
  virtual int32_t TallyGetChannelCount(const TallyChannelSet& channels) = 0;
  // A subscription to the set's channels, and in `subscribed` the channels that it took. None where
  // it could not be made.
  virtual std::shared_ptr<TallySubscription> TallyCreateSubscription(
      const TallyChannelSet& channels, std::shared_ptr<const TallyChannelSet>& subscribed) = 0;
  // The channels' values now. Channels that are gone are left out, without an error, also where
  // that leaves a set of none. A missing subscription or set is an error.
  virtual std::shared_ptr<const TallySampleSet> TallyCreateSamples(
      const std::shared_ptr<TallySubscription>& subscription,
      const std::shared_ptr<const TallyChannelSet>& subscribed, Error& error) = 0;
  // `later` minus `earlier`, channel by channel; channels that only one of them has are left out.
  // None, without an error, where `earlier` is absent. A difference that does not fit saturates.
  virtual std::shared_ptr<const TallySampleSet> TallyCreateSamplesDelta(
      const std::shared_ptr<const TallySampleSet>& earlier, const TallySampleSet& later,
      Error& error) = 0;
  // Calls `iterator` for each channel, in the library's order, until it answers other than 0.
  virtual void TallyIterate(const TallySampleSet& samples, Iterator iterator) = 0;
  // Wild values saturate.
  virtual int64_t TallySimpleGetIntegerValue(const TallyChannelSample& sample) = 0;
  virtual Name TallyChannelGetChannelName(const TallyChannelSample& sample) = 0;
};
