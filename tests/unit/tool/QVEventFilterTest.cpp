#include "tools/qvctl/QVEventFilter.h"
#include "tools/qvctl/QVToolFailure.h"

#include <gtest/gtest.h>

namespace {

using Kind = QVStoredEvent::Kind;
using Words = QVEventFilter::Words;

constexpr int64_t kSecond = 1'000'000;
constexpr int64_t kNow = 1'795'242'001 * kSecond;

QVStoredEvent message() {
  QVStoredEvent event;
  event.time = kNow - 60 * kSecond;
  event.session = 7;
  event.service = "telephony";
  event.category = 3;
  event.type = 1;
  return event;
}

QVStoredEvent analytics() {
  QVStoredEvent event;
  event.kind = Kind::analytics;
  event.time = kNow - 60 * kSecond;
  event.name = "net.quillon.quietvox.Session_Playback.Start";
  event.category = 0x08000003;
  event.type = 1;
  return event;
}

bool wants(const Words& words, const QVStoredEvent& event) {
  return QVEventFilter(words, kNow).wants(event);
}

TEST(QVEventFilterTest, WantsEverythingByDefault) {
  EXPECT_TRUE(QVEventFilter().wants(message()));
  EXPECT_TRUE(wants({}, message()));
  EXPECT_TRUE(wants({}, analytics()));
}

TEST(QVEventFilterTest, TakesOneOfSeveralValues) {
  EXPECT_TRUE(wants({.sessions = {"8", "7"}}, message()));
  EXPECT_FALSE(wants({.sessions = {"8", "9"}}, message()));
  EXPECT_TRUE(wants({.services = {"haptics", "2"}}, message()));
  EXPECT_TRUE(wants({.types = {"Stop", "start"}}, message()));
  EXPECT_TRUE(wants({.kinds = {"loss", "message"}}, message()));
}

TEST(QVEventFilterTest, TakesAllOfSeveralProperties) {
  EXPECT_TRUE(wants({.sessions = {"7"}, .types = {"1"}}, message()));
  EXPECT_FALSE(wants({.sessions = {"7"}, .types = {"2"}}, message()));
  EXPECT_FALSE(wants({.kinds = {"start"}, .sessions = {"7"}}, message()));
}

TEST(QVEventFilterTest, LeavesOutWhatLacksTheProperty) {
  EXPECT_FALSE(wants({.sessions = {"7"}}, analytics()));
  EXPECT_FALSE(wants({.services = {"telephony"}}, analytics()));
  EXPECT_FALSE(wants({.names = {"*"}}, message()));
  QVStoredEvent loss;
  loss.kind = Kind::loss;
  EXPECT_FALSE(wants({.categories = {"Playback"}}, loss));
  EXPECT_FALSE(wants({.types = {"Start"}}, loss));
}

TEST(QVEventFilterTest, KnowsComponentsWhereTheStoreKeepsThem) {
  EXPECT_TRUE(wants({.categories = {"Session.Playback"}}, analytics()));
  EXPECT_FALSE(wants({.categories = {"DSP.Playback"}}, analytics()));
  EXPECT_TRUE(wants({.categories = {"Session"}}, analytics()));
  EXPECT_FALSE(wants({.categories = {"DSP"}}, analytics()));
  // Of messages it does not.
  EXPECT_TRUE(wants({.categories = {"DSP.Playback"}}, message()));
  EXPECT_TRUE(wants({.categories = {"DSP"}}, message()));
  EXPECT_FALSE(wants({.categories = {"DSP.Record"}}, message()));
}

TEST(QVEventFilterTest, MatchesNames) {
  EXPECT_TRUE(wants({.names = {"*.session_*"}}, analytics()));
  EXPECT_TRUE(
      wants({.names = {"nothing", "net.quillon.quietvox.Session_Playback.Star?"}}, analytics()));
  EXPECT_FALSE(wants({.names = {"Session_Playback"}}, analytics()));
}

TEST(QVEventFilterTest, LooksAtTheTime) {
  EXPECT_TRUE(wants({.since = "1m"}, message()));
  EXPECT_FALSE(wants({.since = "59s"}, message()));
  EXPECT_TRUE(wants({.until = "1m"}, message()));
  EXPECT_FALSE(wants({.until = "61s"}, message()));
}

TEST(QVEventFilterTest, FindsServiceTypesWithoutAName) {
  QVStoredEvent event = message();
  event.service = "(null)";
  EXPECT_TRUE(wants({.services = {"4711"}}, event));
}

TEST(QVEventFilterTest, RefusesWordsThatAreNone) {
  for (const Words& words :
       {Words{.kinds = {"nothing"}}, Words{.sessions = {"x"}}, Words{.sessions = {""}},
        Words{.services = {"nothing"}}, Words{.categories = {"nothing"}},
        Words{.types = {"nothing"}}, Words{.since = "nothing"}, Words{.until = "nothing"},
        Words{.since = ""}, Words{.until = ""}}) {
    try {
      [[maybe_unused]] const QVEventFilter filter(words, kNow);
      ADD_FAILURE() << "taken";
    } catch (const QVToolFailure& failure) {
      EXPECT_EQ(failure.status(), QVToolStatus::wrongUsage);
    }
  }
}

}  // namespace
