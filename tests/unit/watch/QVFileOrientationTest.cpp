#include "platform/fake/QVFakeLog.h"
#include "platform/linux/orientation/QVFileOrientation.h"
#include "tests/support/QVFileReadings.h"
#include "tests/support/QVTemporaryRoot.h"

#include <filesystem>
#include <fstream>
#include <utility>
#include <vector>

#include <gmock/gmock.h>
#include <poll.h>
#include <sys/stat.h>

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

constexpr int kLimit = 60'000;  // milliseconds; only ends a test that has failed

// The test's thread is the orientation's: it works when the bell rings.
class QVFileOrientationTest : public testing::Test {
 protected:
  // Registered; the thread has not come to it yet.
  void enroll() {
    registrations_.add("id", [this](int32_t orientation) { told_.push_back(orientation); });
  }
  void add() {
    enroll();
    orientation_->work();
  }
  void remove() {
    registrations_.remove("id");
    orientation_->work();
  }
  // Whatever was done to the file before has been taken notice of.
  std::vector<int32_t> takeTold() {
    std::string reason;
    const auto marked = std::make_shared<const QVBell>();
    const auto token = watcher_->watch(
        {root_.runtime(), "marker", QVDirectoryWatcher::Kind::posts}, [marked] { marked->ring(); },
        reason);
    std::ofstream(root_.runtime() / "marker", std::ios::app).flush();
    pollfd event{marked->descriptor(), POLLIN, 0};
    EXPECT_EQ(::poll(&event, 1, kLimit), 1);
    watcher_->unwatch(token);
    orientation_->work();
    return std::exchange(told_, {});
  }
  // Has the bell rung since this was asked last?
  bool hasRung() const {
    pollfd event{bell_->descriptor(), POLLIN, 0};
    const bool rung = ::poll(&event, 1, 0) == 1;
    bell_->hush();
    return rung;
  }

  void write(const std::string& text) const { std::ofstream(file_) << text; }
  // As a word is written by a shell.
  void say(const std::string& word) const { write(word + '\n'); }

  QVTemporaryRoot root_;
  std::filesystem::path file_ = root_.runtime() / "ui-orientation";
  QVFakeLog log_;
  const std::shared_ptr<const QVBell> bell_ = std::make_shared<const QVBell>();
  const std::shared_ptr<QVDirectoryWatcher> watcher_ = std::make_shared<QVDirectoryWatcher>(log_);
  QVOrientationRegistrations registrations_{log_,
                                            [this] { return QVFileOrientation::valueIn(file_); }};
  std::unique_ptr<QVFileOrientation> orientation_ =
      std::make_unique<QVFileOrientation>(log_, watcher_, file_, bell_, registrations_);
  std::vector<int32_t> told_;
};

TEST_F(QVFileOrientationTest, TellsEachChangeOfTheWord) {
  say("normal");
  add();
  EXPECT_THAT(takeTold(), IsEmpty());
  say("left-up");
  EXPECT_THAT(takeTold(), ElementsAre(QVOrientation::kLeftUp));
  EXPECT_TRUE(hasRung());
  say("left-up");
  EXPECT_THAT(takeTold(), IsEmpty());
  say("right-up");
  EXPECT_THAT(takeTold(), ElementsAre(QVOrientation::kRightUp));
  say("bottom-up");
  EXPECT_THAT(takeTold(), ElementsAre(QVOrientation::kBottomUp));
  say("undefined");
  EXPECT_THAT(takeTold(), ElementsAre(QVOrientation::kUndefined));
  say("normal");
  EXPECT_THAT(takeTold(), ElementsAre(QVOrientation::kNormal));
}

TEST_F(QVFileOrientationTest, TellsWhatChangedBeforeItsThreadCameToIt) {
  say("normal");
  enroll();
  say("left-up");
  EXPECT_THAT(takeTold(), ElementsAre(QVOrientation::kLeftUp));
  // Those that come while others are registered share what is known.
  say("right-up");
  enroll();
  EXPECT_THAT(takeTold(), ElementsAre(QVOrientation::kRightUp, QVOrientation::kRightUp));
}

TEST_F(QVFileOrientationTest, TellsNothingOfAFileThatIsBeingWrittenAsItsThreadComesToIt) {
  say("normal");
  enroll();
  write("");
  EXPECT_THAT(takeTold(), IsEmpty());
  say("normal");
  EXPECT_THAT(takeTold(), IsEmpty());
}

TEST_F(QVFileOrientationTest, TakesAMissingFileForUndefined) {
  add();
  say("normal");
  EXPECT_THAT(takeTold(), ElementsAre(QVOrientation::kNormal));
  std::filesystem::remove(file_);
  EXPECT_THAT(takeTold(), ElementsAre(QVOrientation::kUndefined));
  say("undefined");
  EXPECT_THAT(takeTold(), IsEmpty());
}

TEST_F(QVFileOrientationTest, FollowsAFileThatIsReplacedOrMovedAway) {
  say("normal");
  add();
  const auto other = root_.runtime() / "ui-orientation.new";
  std::ofstream(other) << "left-up";
  EXPECT_THAT(takeTold(), IsEmpty());
  std::filesystem::rename(other, file_);
  EXPECT_THAT(takeTold(), ElementsAre(QVOrientation::kLeftUp));
  std::filesystem::rename(file_, other);
  EXPECT_THAT(takeTold(), ElementsAre(QVOrientation::kUndefined));
}

TEST_F(QVFileOrientationTest, TakesWhatIsNoWordForUndefined) {
  for (const std::string text :
       {"sideways", "Normal", "normal left-up", "normal\n\nnormal", "3", "normal\x01"}) {
    say("normal");
    add();
    write(text);
    EXPECT_THAT(takeTold(), ElementsAre(QVOrientation::kUndefined)) << text;
    remove();
  }
}

TEST_F(QVFileOrientationTest, IgnoresBlanksAroundTheWord) {
  add();
  write(" \t\r\nleft-up \r\n\t ");
  EXPECT_THAT(takeTold(), ElementsAre(QVOrientation::kLeftUp));
  write("normal");
  EXPECT_THAT(takeTold(), ElementsAre(QVOrientation::kNormal));
}

TEST_F(QVFileOrientationTest, KeepsToWhatAFileSaidThatIsEmptyNow) {
  say("normal");
  add();
  write("");
  EXPECT_THAT(takeTold(), IsEmpty());
  write("\n ");
  EXPECT_THAT(takeTold(), IsEmpty());
  say("normal");
  EXPECT_THAT(takeTold(), IsEmpty());
  say("left-up");
  EXPECT_THAT(takeTold(), ElementsAre(QVOrientation::kLeftUp));
}

TEST_F(QVFileOrientationTest, TakesAnEmptyFileForUndefinedToBeginWith) {
  write("");
  add();
  say("normal");
  EXPECT_THAT(takeTold(), ElementsAre(QVOrientation::kNormal));
}

TEST_F(QVFileOrientationTest, ReadsNoMoreThanAWordNeeds) {
  const std::string longest = "left-up" + std::string(QVFileOrientation::kMaximumBytes - 7, '\n');
  add();
  write(longest);
  EXPECT_THAT(takeTold(), ElementsAre(QVOrientation::kLeftUp));
  write(longest + '\n');
  EXPECT_THAT(takeTold(), ElementsAre(QVOrientation::kUndefined));
}

TEST_F(QVFileOrientationTest, WaitsForNoPipe) {
  ASSERT_EQ(::mkfifo(file_.c_str(), 0600), 0);
  add();
  std::filesystem::remove(file_);
  say("normal");
  EXPECT_THAT(takeTold(), ElementsAre(QVOrientation::kNormal));
  ASSERT_EQ(::mkfifo((root_.runtime() / "pipe").c_str(), 0600), 0);
  std::filesystem::rename(root_.runtime() / "pipe", file_);
  EXPECT_THAT(takeTold(), ElementsAre(QVOrientation::kUndefined));
}

TEST_F(QVFileOrientationTest, FollowsNoLink) {
  say("normal");
  add();
  std::ofstream(root_.path() / "elsewhere") << "left-up";
  std::filesystem::remove(file_);
  std::filesystem::create_symlink(root_.path() / "elsewhere", file_);
  EXPECT_THAT(takeTold(), ElementsAre(QVOrientation::kUndefined));
}

TEST_F(QVFileOrientationTest, BeginsAnewWithEachPeriodOfDemand) {
  say("normal");
  add();
  remove();
  EXPECT_THAT(takeTold(), IsEmpty());
  say("left-up");
  add();
  EXPECT_THAT(takeTold(), IsEmpty());
  // As quick as that: the thread has not seen that nobody was registered.
  registrations_.remove("id");
  say("right-up");
  add();
  EXPECT_THAT(takeTold(), IsEmpty());
  say("left-up");
  EXPECT_THAT(takeTold(), ElementsAre(QVOrientation::kLeftUp));
}

TEST_F(QVFileOrientationTest, LeavesTheFileAloneWhileNobodyIsRegistered) {
  say("normal");
  QVFileReadings readings(file_);
  orientation_->work();
  add();
  EXPECT_TRUE(readings.await());
  remove();
  EXPECT_FALSE(hasRung());
  say("left-up");
  EXPECT_THAT(takeTold(), IsEmpty());
  EXPECT_FALSE(hasRung());
  EXPECT_FALSE(readings.haveHappened());
}

TEST_F(QVFileOrientationTest, SaysThatItsDirectoryCannotBeWatched) {
  file_ = root_.runtime() / "missing" / "deeper" / "ui-orientation";
  orientation_ = std::make_unique<QVFileOrientation>(log_, watcher_, file_, bell_, registrations_);
  add();
  orientation_->work();
  EXPECT_THAT(
      log_.renderings(),
      ElementsAre(QVText("3[default] -[QVFileOrientation beginWatch]: cannot watch the user "
                         "interface's orientation: ",
                         file_.parent_path().string(), ": No such file or directory")));
  // Tried again as demand begins again.
  remove();
  std::filesystem::create_directories(file_.parent_path());
  add();
  say("normal");
  pollfd event{bell_->descriptor(), POLLIN, 0};
  EXPECT_EQ(::poll(&event, 1, kLimit), 1);
  orientation_->work();
  EXPECT_THAT(told_, ElementsAre(QVOrientation::kNormal));
}

TEST_F(QVFileOrientationTest, IsSilentOnceItIsGone) {
  say("normal");
  add();
  orientation_ = nullptr;
  bell_->hush();
  say("left-up");
  orientation_ = std::make_unique<QVFileOrientation>(log_, watcher_, file_, bell_, registrations_);
  static_cast<void>(takeTold());
  EXPECT_FALSE(hasRung());
}

}  // namespace
