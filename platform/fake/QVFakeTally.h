#pragma once

#include "platform/QVTally.h"
#include "platform/fake/QVFakeMisuse.h"

#include <atomic>
#include <cstddef>
#include <map>
#include <mutex>
#include <set>
#include <string>
#include <utility>
#include <vector>

// A Tally for tests: publishers are what a test says they are. The library's order is that of
// publication. Channels of one publisher may share a name or have none; a channel is told from
// others by its publisher's names, its own, and its place among those of the same name.
//
// Failures are set for a driver: the pair of names that channels are asked for under, absent ones
// included. Checks that options are 0, that sets are its own and belong to their subscription, and
// that nothing that was handed out is left when it goes.
//
// Threads: any.
class QVFakeTally final : public QVTally {
 public:
  struct Channel {
    Name name;
    int64_t value = 0;
  };
  // A group and a subgroup, as they are published or asked for.
  struct Driver {
    Name group;
    Name subgroup;
    auto operator<=>(const Driver&) const = default;
  };
  // How an operation ends: with an error of this code or none, and with what it would have
  // answered or nothing.
  struct Failure {
    std::optional<int64_t> code;
    bool withSet = false;
  };

  // Codes of the errors that it makes by itself.
  static constexpr int64_t kMissingSubscription = 1;
  static constexpr int64_t kMissingSet = 2;

  QVFakeTally();
  ~QVFakeTally() override;

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

  // Makes these the publisher's channels, in place of earlier ones; they may be none.
  void publish(const Driver& publisher, std::vector<Channel> channels);
  void withdraw(const Driver& publisher);

  // How later operations for the driver end.
  void failChannels(const Driver& driver, Failure failure);
  void failSubscriptions(const Driver& driver);
  void failSamples(const Driver& driver, Failure failure);
  void failDeltas(const Driver& driver, Failure failure);
  void endFailures();

  // The drivers that channels were asked for, in order.
  std::vector<Driver> lookUps() const;
  // Those of the subscriptions that were asked for, in order.
  std::vector<Driver> subscriptions() const;
  std::vector<std::string> takeMisuses() { return misuse_.take(); }

 private:
  class Handed;
  class ChannelSet;
  class Subscription;
  class Sample;
  class SampleSet;

  struct Identity {
    Driver publisher;
    Name name;
    std::size_t place;  // among the publisher's channels of the same name
    bool operator==(const Identity&) const = default;
  };
  struct Failures {
    std::map<Driver, Failure> channels;
    std::set<Driver> subscriptions;
    std::map<Driver, Failure> samples;
    std::map<Driver, Failure> deltas;
  };

  template <class Own, class Given>
  const Own* own(const Given* given, std::string_view what);
  static std::vector<Identity> identities(const Driver& publisher,
                                          const std::vector<Channel>& channels);
  std::optional<int64_t> currentValue(const Identity& identity) const;

  QVFakeMisuse misuse_{"QVFakeTally"};
  // Objects that were handed out and still exist; shared with them.
  const std::shared_ptr<std::atomic<int>> handedOut_;
  mutable std::mutex mutex_;
  // Guarded by mutex_.
  std::vector<std::pair<Driver, std::vector<Channel>>> published_;
  Failures failures_;
  std::vector<Driver> lookUps_;
  std::vector<Driver> subscriptions_;
};
