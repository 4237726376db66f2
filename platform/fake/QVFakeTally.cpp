#include "platform/fake/QVFakeTally.h"

#include "platform/QVText.h"

#include <algorithm>
#include <limits>

// Counts itself while it exists.
class QVFakeTally::Handed {
 public:
  explicit Handed(std::shared_ptr<std::atomic<int>> count) : count_(std::move(count)) {
    count_->fetch_add(1);
  }
  ~Handed() { count_->fetch_sub(1); }
  Handed(const Handed&) = delete;
  Handed& operator=(const Handed&) = delete;

 private:
  const std::shared_ptr<std::atomic<int>> count_;
};

class QVFakeTally::ChannelSet final : public TallyChannelSet {
 public:
  ChannelSet(std::shared_ptr<std::atomic<int>> count, Driver asked, std::vector<Identity> members)
      : driver(std::move(asked)), channels(std::move(members)), handed_(std::move(count)) {}

  const Driver driver;
  const std::vector<Identity> channels;

 private:
  const Handed handed_;
};

class QVFakeTally::Subscription final : public TallySubscription {
 public:
  Subscription(std::shared_ptr<std::atomic<int>> count, Driver asked, std::vector<Identity> members)
      : driver(std::move(asked)), channels(std::move(members)), handed_(std::move(count)) {}

  const Driver driver;
  const std::vector<Identity> channels;

 private:
  const Handed handed_;
};

class QVFakeTally::Sample final : public TallyChannelSample {
 public:
  Sample(Identity channel, int64_t sampled) : identity(std::move(channel)), value(sampled) {}

  Identity identity;
  int64_t value;
};

class QVFakeTally::SampleSet final : public TallySampleSet {
 public:
  SampleSet(std::shared_ptr<std::atomic<int>> count, Driver asked, std::vector<Sample> members)
      : driver(std::move(asked)), samples(std::move(members)), handed_(std::move(count)) {}

  const Driver driver;
  const std::vector<Sample> samples;

 private:
  const Handed handed_;
};

namespace {

QVTally::Error errorOfCode(int64_t code) {
  return QVError{.domain = QVTally::kErrorDomain, .code = code, .userInfo = {}};
}

bool matches(const QVTally::Name& asked, const QVTally::Name& published) {
  return !asked || asked == published;
}

int64_t saturatedDifference(int64_t later, int64_t earlier) {
  int64_t difference = 0;
  if (!__builtin_sub_overflow(later, earlier, &difference)) return difference;
  return later < earlier ? std::numeric_limits<int64_t>::min()
                         : std::numeric_limits<int64_t>::max();
}

// Ends an operation as it would end, or as `failures` has it for the driver.
template <class Failures, class Set>
std::shared_ptr<const Set> endOperation(const Failures& failures, const QVFakeTally::Driver& driver,
                                        std::shared_ptr<const Set> set, QVTally::Error& error) {
  const auto failure = failures.find(driver);
  if (failure == failures.end()) return set;
  if (failure->second.code) error = errorOfCode(*failure->second.code);
  return failure->second.withSet ? std::move(set) : nullptr;
}

}  // namespace

QVFakeTally::QVFakeTally() : handedOut_(std::make_shared<std::atomic<int>>(0)) {}

QVFakeTally::~QVFakeTally() {
  if (const int left = handedOut_->load(); left != 0) {
    misuse_.note(QVText(left, " objects that it handed out are left"));
  }
}

template <class Own, class Given>
const Own* QVFakeTally::own(const Given* given, std::string_view what) {
  const auto* const typed = dynamic_cast<const Own*>(given);
  if (typed == nullptr) misuse_.note(QVText("a ", what, " that was not made here"));
  return typed;
}

std::vector<QVFakeTally::Identity> QVFakeTally::identities(const Driver& publisher,
                                                           const std::vector<Channel>& channels) {
  std::vector<Identity> identities;
  std::map<Name, std::size_t> places;
  for (const Channel& channel : channels) {
    identities.push_back({publisher, channel.name, places[channel.name]++});
  }
  return identities;
}

std::optional<int64_t> QVFakeTally::currentValue(const Identity& identity) const {
  const auto publisher = std::ranges::find(published_, identity.publisher,
                                           &std::pair<Driver, std::vector<Channel>>::first);
  if (publisher == published_.end()) return std::nullopt;
  const auto current = identities(publisher->first, publisher->second);
  const auto found = std::ranges::find(current, identity);
  if (found == current.end()) return std::nullopt;
  return publisher->second[static_cast<std::size_t>(found - current.begin())].value;
}

std::shared_ptr<const TallyChannelSet> QVFakeTally::TallyCopyChannelsInGroup(const Name& group,
                                                                             const Name& subgroup,
                                                                             uint64_t options,
                                                                             Error& error) {
  if (options != 0) misuse_.note("options other than 0");
  const Driver driver{group, subgroup};
  const std::lock_guard lock(mutex_);
  lookUps_.push_back(driver);
  bool any = false;
  std::vector<Identity> members;
  for (const auto& [publisher, channels] : published_) {
    if (!matches(group, publisher.group) || !matches(subgroup, publisher.subgroup)) continue;
    any = true;
    const std::vector<Identity> added = identities(publisher, channels);
    members.insert(members.end(), added.begin(), added.end());
  }
  std::shared_ptr<const TallyChannelSet> set;
  if (any) set = std::make_shared<ChannelSet>(handedOut_, driver, std::move(members));
  return endOperation(failures_.channels, driver, std::move(set), error);
}

int32_t QVFakeTally::TallyGetChannelCount(const TallyChannelSet& channels) {
  const auto* const set = own<ChannelSet>(&channels, "channel set");
  return set == nullptr ? 0 : static_cast<int32_t>(set->channels.size());
}

std::shared_ptr<TallySubscription> QVFakeTally::TallyCreateSubscription(
    const TallyChannelSet& channels, std::shared_ptr<const TallyChannelSet>& subscribed) {
  const auto* const set = own<ChannelSet>(&channels, "channel set");
  subscribed = nullptr;
  if (set == nullptr) return nullptr;
  const std::lock_guard lock(mutex_);
  subscriptions_.push_back(set->driver);
  if (failures_.subscriptions.contains(set->driver)) return nullptr;
  subscribed = std::make_shared<ChannelSet>(handedOut_, set->driver, set->channels);
  return std::make_shared<Subscription>(handedOut_, set->driver, set->channels);
}

std::shared_ptr<const TallySampleSet> QVFakeTally::TallyCreateSamples(
    const std::shared_ptr<TallySubscription>& subscription,
    const std::shared_ptr<const TallyChannelSet>& subscribed, Error& error) {
  if (subscription == nullptr || subscribed == nullptr) {
    error = errorOfCode(subscription == nullptr ? kMissingSubscription : kMissingSet);
    return nullptr;
  }
  const auto* const made = own<Subscription>(subscription.get(), "subscription");
  const auto* const set = own<ChannelSet>(subscribed.get(), "channel set");
  if (made == nullptr || set == nullptr) return nullptr;
  if (made->channels != set->channels) misuse_.note("a channel set of another subscription");
  const std::lock_guard lock(mutex_);
  std::vector<Sample> samples;
  for (const Identity& identity : set->channels) {
    if (const auto value = currentValue(identity)) samples.emplace_back(identity, *value);
  }
  return endOperation(failures_.samples, made->driver,
                      std::shared_ptr<const TallySampleSet>(std::make_shared<SampleSet>(
                          handedOut_, made->driver, std::move(samples))),
                      error);
}

std::shared_ptr<const TallySampleSet> QVFakeTally::TallyCreateSamplesDelta(
    const std::shared_ptr<const TallySampleSet>& earlier, const TallySampleSet& later,
    Error& error) {
  const auto* const minuend = own<SampleSet>(&later, "sample set");
  if (minuend == nullptr) return nullptr;
  std::shared_ptr<const TallySampleSet> differences;
  if (earlier != nullptr) {
    const auto* const subtrahend = own<SampleSet>(earlier.get(), "sample set");
    if (subtrahend == nullptr) return nullptr;
    std::vector<Sample> samples;
    for (const Sample& sample : minuend->samples) {
      const auto before =
          std::ranges::find(subtrahend->samples, sample.identity, &Sample::identity);
      if (before == subtrahend->samples.end()) continue;
      samples.emplace_back(sample.identity, saturatedDifference(sample.value, before->value));
    }
    differences = std::make_shared<SampleSet>(handedOut_, minuend->driver, std::move(samples));
  }
  const std::lock_guard lock(mutex_);
  return endOperation(failures_.deltas, minuend->driver, std::move(differences), error);
}

void QVFakeTally::TallyIterate(const TallySampleSet& samples, Iterator iterator) {
  const auto* const set = own<SampleSet>(&samples, "sample set");
  if (!iterator) misuse_.note("an iteration without an iterator");
  if (set == nullptr || !iterator) return;
  for (const Sample& sample : set->samples) {
    if (iterator(sample) != 0) return;
  }
}

int64_t QVFakeTally::TallySimpleGetIntegerValue(const TallyChannelSample& sample) {
  const auto* const typed = own<Sample>(&sample, "sample");
  return typed == nullptr ? 0 : typed->value;
}

QVTally::Name QVFakeTally::TallyChannelGetChannelName(const TallyChannelSample& sample) {
  const auto* const typed = own<Sample>(&sample, "sample");
  return typed == nullptr ? std::nullopt : typed->identity.name;
}

void QVFakeTally::publish(const Driver& publisher, std::vector<Channel> channels) {
  const std::lock_guard lock(mutex_);
  const auto found =
      std::ranges::find(published_, publisher, &std::pair<Driver, std::vector<Channel>>::first);
  if (found == published_.end()) {
    published_.emplace_back(publisher, std::move(channels));
  } else {
    found->second = std::move(channels);
  }
}

void QVFakeTally::withdraw(const Driver& publisher) {
  const std::lock_guard lock(mutex_);
  std::erase_if(published_, [&publisher](const auto& entry) { return entry.first == publisher; });
}

void QVFakeTally::failChannels(const Driver& driver, Failure failure) {
  const std::lock_guard lock(mutex_);
  failures_.channels.insert_or_assign(driver, failure);
}

void QVFakeTally::failSubscriptions(const Driver& driver) {
  const std::lock_guard lock(mutex_);
  failures_.subscriptions.insert(driver);
}

void QVFakeTally::failSamples(const Driver& driver, Failure failure) {
  const std::lock_guard lock(mutex_);
  failures_.samples.insert_or_assign(driver, failure);
}

void QVFakeTally::failDeltas(const Driver& driver, Failure failure) {
  const std::lock_guard lock(mutex_);
  failures_.deltas.insert_or_assign(driver, failure);
}

void QVFakeTally::endFailures() {
  const std::lock_guard lock(mutex_);
  failures_ = {};
}

std::vector<QVFakeTally::Driver> QVFakeTally::lookUps() const {
  const std::lock_guard lock(mutex_);
  return lookUps_;
}

std::vector<QVFakeTally::Driver> QVFakeTally::subscriptions() const {
  const std::lock_guard lock(mutex_);
  return subscriptions_;
}
