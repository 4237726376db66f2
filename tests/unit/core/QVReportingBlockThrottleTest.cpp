#include "QVServices/Statistics/Service/QVReportingBlockThrottle.h"
#include "platform/QVText.h"
#include "platform/fake/QVFakePlatform.h"

#include <chrono>
#include <cmath>
#include <memory>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include <gmock/gmock.h>

namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;
using testing::IsEmpty;

constexpr uint32_t kSessionPlayback = 0x08000003;
constexpr uint16_t kStart = 1;

constexpr const char* kRunning =
    "7[default] -[QVReportingBlockThrottle init]: calling workingRunLoop run from inside thread "
    "block";
constexpr const char* kSleeping = "7[default] -[QVReportingBlockThrottle init]: sleeping in thread";
constexpr const char* kWaiting =
    "7[default] -[QVReportingBlockThrottle waitForCompletion]: Waiting up to 5 seconds for "
    "blockThrottle queue to be empty.";

// A throttle in virtual time. Its thread makes its first pass with the first items that are run,
// and looks for new keys ten times a second from then on.
class QVReportingBlockThrottleTest : public testing::Test {
 protected:
  // Blocks use what is declared before the platform until that ends the thread.
  ~QVReportingBlockThrottleTest() override {
    if (throttle_ != nullptr) throttle_->setShouldKeepRunning(false);
  }

  QVFunction<void()> noteBlock(const std::string& what) {
    return [this, what] { note(what); };
  }
  // With the moment, in milliseconds.
  void note(const std::string& what) {
    const auto now = std::chrono::floor<std::chrono::milliseconds>(platform_.clock().steadyTime());
    notes_.push_back(std::to_string(now.count()).append(" ").append(what));
  }
  void add(QVFunction<void()> block, const QVDictionary& message = {}, int64_t reporterID = 42,
           uint32_t category = kSessionPlayback, uint16_t type = kStart) {
    throttle_->addMessageBlock(std::move(block), reporterID, message, category, type);
  }
  void addNote(const std::string& what, const QVDictionary& message = {}) {
    add(noteBlock(what), message);
  }
  static QVDictionary named(const std::string& name, const QVValue& seconds) {
    return {{"_throttle_seconds", seconds}, {"name", name}};
  }
  void advance(QVDuration duration) { platform_.queues().advance(duration); }
  void at(QVDuration moment, QVWorkItem item) {
    platform_.queues().after(moment - platform_.clock().steadyTime(), std::move(item));
  }
  void pause(QVDuration duration) { platform_.runLoopThreads().pause(duration); }
  std::vector<std::string> lines() { return platform_.log().renderings(); }
  static std::string completionLine(const std::string& counts) {
    return std::string(
               "6[default] -[QVReportingBlockThrottle waitForCompletion]: waitForCompletion. ")
        .append(counts);
  }

  std::vector<std::string> notes_;
  QVFakePlatform platform_;
  std::shared_ptr<QVReportingBlockThrottle> throttle_ = QVReportingBlockThrottle::init();
};

TEST_F(QVReportingBlockThrottleTest, StartsAThreadAndKeepsItRunning) {
  EXPECT_TRUE(throttle_->shouldKeepRunning());
  EXPECT_THAT(throttle_->timersInFlight(), IsEmpty());
  EXPECT_THAT(throttle_->unscheduledTimerKeys(), IsEmpty());
  EXPECT_THAT(platform_.runLoopThreads().threads(), ElementsAre(throttle_->queueThread()));
  EXPECT_EQ(throttle_->queueThread()->name(), "qv-throttle");
  advance(1h);
  EXPECT_FALSE(throttle_->queueThread()->isFinished());
}

TEST_F(QVReportingBlockThrottleTest, CannotBeHadWithoutAThread) {
  platform_.runLoopThreads().refuseThreads();
  EXPECT_EQ(QVReportingBlockThrottle::init(), nullptr);
}

TEST_F(QVReportingBlockThrottleTest, RunsOnlyTheLastOfEqualMessages) {
  addNote("first");
  advance(200ms);
  addNote("second");
  advance(200ms);
  addNote("third");
  advance(499ms);
  EXPECT_THAT(notes_, IsEmpty());
  advance(10s);
  EXPECT_THAT(notes_, ElementsAre("900 third"));
}

TEST_F(QVReportingBlockThrottleTest, FoldsMessagesWhoseTimerIsNotYetAttached) {
  addNote("first");
  addNote("second");
  EXPECT_THAT(throttle_->unscheduledTimerKeys(),
              ElementsAre("reporterID|42|Session_Playback|Start"));
  EXPECT_EQ(throttle_->timersInFlight(), throttle_->unscheduledTimerKeys());
  advance(0s);
  EXPECT_THAT(throttle_->unscheduledTimerKeys(), IsEmpty());
  EXPECT_THAT(throttle_->timersInFlight(), ElementsAre("reporterID|42|Session_Playback|Start"));
  advance(10s);
  EXPECT_THAT(notes_, ElementsAre("500 second"));
  EXPECT_THAT(throttle_->timersInFlight(), IsEmpty());
}

TEST_F(QVReportingBlockThrottleTest, FoldsMessagesThatDifferInOneIgnoredValue) {
  const QVArray blacklist{"level"};
  for (int i = 0; i < 3; ++i) {
    addNote(QVText("system uptime ", i), {{"systemuptime_sec", i}});
    addNote(QVText("process uptime ", i), {{"processuptime_ms", i}});
    addNote(QVText("timestamp ", i), {{"qvreporting_timestamp", i}});
    addNote(QVText("named ", i), {{"_comparison_field_blacklist", blacklist}, {"level", i}});
  }
  advance(10s);
  EXPECT_THAT(notes_, ElementsAre("500 system uptime 2", "500 process uptime 2", "500 timestamp 2",
                                  "500 named 2"));
}

TEST_F(QVReportingBlockThrottleTest, FoldsMessagesThatDifferInAllIgnoredValuesAtOnce) {
  const QVArray blacklist{"level"};
  for (int i = 0; i < 3; ++i) {
    addNote(std::to_string(i), {{"systemuptime_sec", i},
                                {"processuptime_ms", i},
                                {"qvreporting_timestamp", i},
                                {"_comparison_field_blacklist", blacklist},
                                {"level", i}});
  }
  advance(10s);
  EXPECT_THAT(notes_, ElementsAre("500 2"));
}

TEST_F(QVReportingBlockThrottleTest, KeepsMessagesApartThatDifferInTheirKeys) {
  addNote("without", {{"a", 1}});
  addNote("with", {{"a", 1}, {"systemuptime_sec", 7}});
  advance(10s);
  EXPECT_THAT(notes_, ElementsAre("500 without", "500 with"));
}

TEST_F(QVReportingBlockThrottleTest, KeepsReportersCategoriesAndTypesApart) {
  const QVDictionary message{{"a", 1}};
  add(noteBlock("one"), message);
  add(noteBlock("another reporter"), message, 43);
  add(noteBlock("another category"), message, 42, 0x08000002);
  add(noteBlock("another type"), message, 42, kSessionPlayback, 2);
  EXPECT_EQ(throttle_->timersInFlight().size(), 4u);
  advance(10s);
  EXPECT_THAT(notes_, ElementsAre("500 one", "500 another reporter", "500 another category",
                                  "500 another type"));
}

TEST_F(QVReportingBlockThrottleTest, TakesTheDelayOfTheMessage) {
  addNote("4.9", named("a", 4.9));
  addNote("5", named("b", 5));
  addNote("7", named("c", 7));
  addNote("string", named("d", "3"));
  addNote("NaN", named("e", std::nan("")));
  addNote("0", named("f", 0));
  addNote("negative", named("g", -3));
  advance(10s);
  EXPECT_THAT(notes_, ElementsAre("0 0", "0 negative", "500 5", "500 7", "500 string", "500 NaN",
                                  "4900 4.9"));
}

TEST_F(QVReportingBlockThrottleTest, TakesTheDelayOfTheLastMessage) {
  addNote("long", named("a", 4));
  advance(1s);
  addNote("short", named("a", 0.25));
  advance(10s);
  EXPECT_THAT(notes_, ElementsAre("1250 short")) << "the delay is no part of the key";
}

TEST_F(QVReportingBlockThrottleTest, RunsBlocksOnItsOwnThread) {
  std::vector<std::thread::id> identifiers;
  for (const char* const name : {"a", "b"}) {
    add([&] { identifiers.push_back(std::this_thread::get_id()); }, named(name, 0.5));
  }
  advance(10s);
  ASSERT_EQ(identifiers.size(), 2u);
  EXPECT_EQ(identifiers[0], identifiers[1]);
  EXPECT_NE(identifiers[0], std::this_thread::get_id());
}

TEST_F(QVReportingBlockThrottleTest, AttachesKeysThatComeMeanwhileOnceAllTimersHaveFired) {
  addNote("attached", named("a", 2));
  advance(1s);
  addNote("due long since", named("b", 0.5));
  addNote("due later", named("c", 4));
  advance(10s);
  EXPECT_THAT(notes_, ElementsAre("2000 attached", "2100 due long since", "5000 due later"))
      << "delays count from the message";
}

TEST_F(QVReportingBlockThrottleTest, HoldsOtherKeysBackWhileEqualMessagesKeepComing) {
  addNote("stream", named("a", 0.5));
  advance(100ms);
  addNote("held back", named("b", 0.5));
  for (int i = 0; i < 30; ++i) {
    addNote("stream", named("a", 0.5));
    advance(100ms);
  }
  EXPECT_THAT(notes_, IsEmpty());
  advance(10s);
  EXPECT_THAT(notes_, ElementsAre("3500 stream", "3600 held back"));
}

TEST_F(QVReportingBlockThrottleTest, RunsAgainForAKeyThatIsFreeAgain) {
  addNote("first");
  advance(1s);
  addNote("second");
  advance(1s);
  EXPECT_THAT(notes_, ElementsAre("500 first", "1500 second"));
}

TEST_F(QVReportingBlockThrottleTest, DropsTheBlockOfADuplicateThatComesWhileTheKeysBlockRuns) {
  const auto late = std::make_shared<int>();
  add([this] {
    note("running");
    pause(1s);
    note("done");
  });
  at(1s, [this, late] {
    EXPECT_EQ(throttle_->timersInFlight().size(), 1u) << "the entry is still there";
    add([this, late] { note("late"); });
    EXPECT_THAT(throttle_->unscheduledTimerKeys(), IsEmpty());
  });
  advance(1400ms);
  EXPECT_EQ(late.use_count(), 2) << "in the place of the one that runs";
  advance(10s);
  EXPECT_THAT(notes_, ElementsAre("500 running", "1500 done"));
  EXPECT_EQ(late.use_count(), 1);
  EXPECT_THAT(throttle_->timersInFlight(), IsEmpty());
  addNote("next");
  advance(1s);
  EXPECT_THAT(notes_, ElementsAre("500 running", "1500 done", "11900 next")) << "the key is free";
}

TEST_F(QVReportingBlockThrottleTest, LetsABlockAddMessages) {
  add([this] {
    note("outer");
    addNote("same key");
    addNote("other key", named("a", 0.25));
  });
  advance(10s);
  EXPECT_THAT(notes_, ElementsAre("500 outer", "750 other key"));
}

TEST_F(QVReportingBlockThrottleTest, FreesTheKeyOfABlockThatRaisesAnException) {
  const auto capture = std::make_shared<int>();
  add([capture] { throw std::runtime_error("broken"); });
  addNote("next timer", named("a", 0.75));
  advance(600ms);
  EXPECT_THAT(lines(), ElementsAre("3[default] fire: exception in run loop qv-throttle: broken"));
  EXPECT_EQ(capture.use_count(), 1);
  EXPECT_EQ(throttle_->timersInFlight().size(), 1u);
  advance(400ms);
  addNote("same key");
  advance(10s);
  EXPECT_THAT(notes_, ElementsAre("750 next timer", "1500 same key"));
}

TEST_F(QVReportingBlockThrottleTest, DestroysBlocksOnceTheyHaveRunOrAreReplaced) {
  const auto replaced = std::make_shared<int>();
  const auto ran = std::make_shared<int>();
  add([replaced] {});
  EXPECT_EQ(replaced.use_count(), 2);
  add([ran] {});
  EXPECT_EQ(replaced.use_count(), 1);
  EXPECT_EQ(ran.use_count(), 2);
  advance(500ms);
  EXPECT_EQ(ran.use_count(), 1);
}

TEST_F(QVReportingBlockThrottleTest, LetsAReplacedBlockUseTheThrottleOnItsWayOut) {
  std::shared_ptr<void> onTheWayOut(nullptr, [this](void*) {
    addNote("on the way out", {{"a", 1}});
  });
  add([onTheWayOut] {});
  onTheWayOut.reset();
  addNote("second");
  advance(10s);
  EXPECT_THAT(notes_, ElementsAre("500 second", "500 on the way out"));
}

TEST_F(QVReportingBlockThrottleTest, TakesAnEmptyBlockForOneThatDoesNothing) {
  add(nullptr);
  advance(10s);
  EXPECT_THAT(throttle_->timersInFlight(), IsEmpty());
  EXPECT_THAT(lines(), IsEmpty());
}

TEST_F(QVReportingBlockThrottleTest, WritesNoVerboseLinesUnlessTheDefaultLogIsVerbose) {
  addNote("a");
  addNote("b");
  advance(1s);
  EXPECT_THAT(lines(), IsEmpty());
}

TEST_F(QVReportingBlockThrottleTest, WritesWhatItsThreadDoesWhereTheDefaultLogIsVerbose) {
  QVLog::setDefaultVerbose(true);
  advance(100ms);
  addNote("a", {{"k", "v"}});
  addNote("b", {{"k", "v"}});
  advance(599ms);
  EXPECT_THAT(
      lines(),
      ElementsAre(kSleeping, kSleeping,
                  "7[default] -[QVReportingBlockThrottle "
                  "addMessageBlock:reporterID:message:category:type:]: Dropping duplicate message "
                  "for k|v|reporterID|42|Session_Playback|Start",
                  kRunning, kSleeping));
  EXPECT_THAT(notes_, ElementsAre("600 b"));
}

TEST_F(QVReportingBlockThrottleTest, ReturnsAtOnceFromWaitingForNothing) {
  QVLog::setDefaultVerbose(true);
  throttle_->waitForCompletion();
  EXPECT_EQ(platform_.clock().steadyTime(), 0s);
  EXPECT_THAT(lines(), ElementsAre(completionLine("timersInFlight=0 unscheduledTimerKeys=0")));
}

TEST_F(QVReportingBlockThrottleTest, WaitsUntilThePollAfterTheLastTimer) {
  addNote("4.9", named("a", 4.9));
  addNote("0.6", named("b", 0.6));
  throttle_->waitForCompletion();
  EXPECT_EQ(platform_.clock().steadyTime(), 5s);
  EXPECT_THAT(notes_, ElementsAre("600 0.6", "4900 4.9"));
  EXPECT_THAT(lines(), ElementsAre(completionLine("timersInFlight=2 unscheduledTimerKeys=2")));
}

TEST_F(QVReportingBlockThrottleTest, StopsWaitingAtTheFirstPollThatFindsNothing) {
  addNote("a", named("a", 0.6));
  advance(300ms);
  throttle_->waitForCompletion();
  EXPECT_EQ(platform_.clock().steadyTime(), 800ms);
  EXPECT_THAT(lines(), ElementsAre(completionLine("timersInFlight=1 unscheduledTimerKeys=0")));
}

TEST_F(QVReportingBlockThrottleTest, GivesUpWaitingAfterFiveSeconds) {
  QVLog::setDefaultVerbose(true);
  addNote("first", named("a", 4.5));
  advance(1ms);
  at(4s, [this] { addNote("put off", named("a", 4.5)); });
  platform_.log().clear();
  throttle_->waitForCompletion();
  EXPECT_EQ(platform_.clock().steadyTime(), 5001ms);
  EXPECT_THAT(
      lines(),
      ElementsAre(completionLine("timersInFlight=1 unscheduledTimerKeys=0"), kWaiting,
                  "7[default] -[QVReportingBlockThrottle "
                  "addMessageBlock:reporterID:message:category:type:]: Dropping duplicate message "
                  "for _throttle_seconds|^|name|a|reporterID|42|Session_Playback|Start",
                  "5[default] -[QVReportingBlockThrottle waitForCompletion]: Giving up on waiting "
                  "for completion after 5 seconds. timersInFlight=1"));
  EXPECT_EQ(throttle_->timersInFlight().size(), 1u) << "left as it is";
  advance(10s);
  EXPECT_THAT(notes_, ElementsAre("8500 put off"));
}

TEST_F(QVReportingBlockThrottleTest, LetsABlockWaitForCompletion) {
  // Its own key is pending until it has run.
  add([this] {
    throttle_->waitForCompletion();
    note("gave up");
  });
  advance(10s);
  EXPECT_THAT(notes_, ElementsAre("5500 gave up"));
}

TEST_F(QVReportingBlockThrottleTest, EndsItsThreadWhenTold) {
  advance(50ms);
  throttle_->setShouldKeepRunning(false);
  advance(49ms);
  EXPECT_FALSE(throttle_->queueThread()->isFinished());
  advance(1ms);
  EXPECT_TRUE(throttle_->queueThread()->isFinished());
  const std::weak_ptr<QVReportingBlockThrottle> watched = throttle_;
  throttle_.reset();
  EXPECT_TRUE(watched.expired());
}

TEST_F(QVReportingBlockThrottleTest, RunsWhatIsAttachedBeforeItsThreadEnds) {
  addNote("attached", named("a", 4));
  advance(1s);
  throttle_->setShouldKeepRunning(false);
  addNote("too late", named("b", 0.5));
  advance(10s);
  EXPECT_TRUE(throttle_->queueThread()->isFinished());
  EXPECT_THAT(notes_, ElementsAre("4000 attached"));
  EXPECT_THAT(throttle_->timersInFlight(),
              ElementsAre("_throttle_seconds|^|name|b|reporterID|42|Session_Playback|Start"));
  EXPECT_EQ(throttle_->unscheduledTimerKeys(), throttle_->timersInFlight());
}

TEST_F(QVReportingBlockThrottleTest, IsHeldByItsThread) {
  addNote("a");
  const std::weak_ptr<QVReportingBlockThrottle> watched = throttle_;
  throttle_.reset();
  advance(1s);
  EXPECT_THAT(notes_, ElementsAre("500 a"));
  const auto throttle = watched.lock();
  ASSERT_NE(throttle, nullptr);
  throttle->setShouldKeepRunning(false);
}

TEST_F(QVReportingBlockThrottleTest, IsFreedWithItsPendingBlocks) {
  const auto attached = std::make_shared<int>();
  const auto unscheduled = std::make_shared<int>();
  add([attached] {}, named("a", 4));
  advance(1s);
  add([unscheduled] {}, named("b", 4));
  throttle_->setShouldKeepRunning(false);
  platform_.runLoopThreads().discard();
  throttle_.reset();
  EXPECT_EQ(attached.use_count(), 1);
  EXPECT_EQ(unscheduled.use_count(), 1);
}

TEST_F(QVReportingBlockThrottleTest, MovesTheTimerOfAWrapper) {
  auto& threads = platform_.runLoopThreads();
  QVReportingBlockThrottleTimerWrapper wrapper(noteBlock("unused"));
  wrapper.setTimer(threads.makeTimer(1h, noteBlock("timer")));
  threads.startThread("test", [&](QVRunLoop& loop) {
    loop.attach(wrapper.timer());
    loop.run();
  });
  advance(1s);
  wrapper.sleepFor(0.25);
  advance(1s);
  EXPECT_THAT(notes_, ElementsAre("1250 timer"));
}

}  // namespace
