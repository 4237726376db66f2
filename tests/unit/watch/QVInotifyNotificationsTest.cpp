#include "platform/fake/QVFakeLog.h"
#include "platform/linux/watch/QVInotifyNotifications.h"
#include "tests/support/QVTemporaryRoot.h"

#include <chrono>
#include <condition_variable>
#include <deque>
#include <filesystem>
#include <fstream>
#include <mutex>
#include <new>
#include <thread>
#include <utility>

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;

constexpr const char* kRegistration =
    "3[default] -[QVInotifyNotifications registerDispatch:token:queue:handler:]: ";

// A queue that keeps items until the test takes them one by one. Threads: any.
class QVHeldQueue final : public QVWorkQueue {
 public:
  void async(QVWorkItem item) override {
    const std::lock_guard lock(mutex_);
    if (std::exchange(refuses_, false)) throw std::bad_alloc();
    items_.push_back(std::move(item));
    changed_.notify_all();
  }
  void asyncAfter(QVDuration, QVWorkItem item) override { async(std::move(item)); }
  std::string_view label() const override { return "held"; }

  // The next item finds no memory.
  void refuseOne() {
    const std::lock_guard lock(mutex_);
    refuses_ = true;
  }
  std::size_t count() const {
    const std::lock_guard lock(mutex_);
    return items_.size();
  }
  // The next item; an empty one where none comes within a minute.
  QVWorkItem take() {
    std::unique_lock lock(mutex_);
    if (!changed_.wait_for(lock, std::chrono::minutes{1}, [this] { return !items_.empty(); })) {
      return nullptr;
    }
    QVWorkItem item = std::move(items_.front());
    items_.pop_front();
    return item;
  }
  // Runs the next item; false where none comes.
  bool runOne() {
    QVWorkItem item = take();
    if (item) item();
    return static_cast<bool>(item);
  }

 private:
  mutable std::mutex mutex_;
  std::condition_variable changed_;
  std::deque<QVWorkItem> items_;
  bool refuses_ = false;
};

class QVInotifyNotificationsTest : public testing::Test {
 protected:
  int32_t add(const std::string& name) { return add(name, queue_, delivered_); }
  int32_t add(const std::string& name, const std::shared_ptr<QVHeldQueue>& queue,
              std::vector<int32_t>& delivered) {
    int32_t token = 0;
    EXPECT_EQ(notifications_->registerDispatch(
                  name, token, queue, [&delivered](int32_t its) { delivered.push_back(its); }),
              QVNotifications::kStatusOK);
    return token;
  }
  uint32_t tryToAdd(std::string_view name, int32_t& token) {
    return notifications_->registerDispatch(name, token, queue_, [](int32_t) {});
  }
  void post(const std::string& name) const {
    std::ofstream(directory_ / name, std::ios::app).flush();
  }
  // Returns when whatever was posted before has been enqueued.
  void settle() {
    const auto markers = std::make_shared<QVHeldQueue>();
    std::vector<int32_t> arrived;
    const int32_t marker = add("marker", markers, arrived);
    post("marker");
    EXPECT_TRUE(markers->runOne());
    notifications_->cancel(marker);
    EXPECT_THAT(arrived, ElementsAre(marker));
  }

  QVTemporaryRoot root_;
  const std::filesystem::path directory_ = root_.runtime() / "notify";
  QVFakeLog log_;
  const std::shared_ptr<QVHeldQueue> queue_ = std::make_shared<QVHeldQueue>();
  const std::shared_ptr<QVDirectoryWatcher> watcher_ =
      std::make_shared<QVDirectoryWatcher>(log_, std::chrono::milliseconds(10));
  std::unique_ptr<QVInotifyNotifications> notifications_ =
      std::make_unique<QVInotifyNotifications>(log_, watcher_, directory_);
  std::vector<int32_t> delivered_;
};

TEST_F(QVInotifyNotificationsTest, FoldsPostsWhileADeliveryWaits) {
  const int32_t token = add("name");
  post("name");
  settle();
  post("name");
  post("name");
  settle();
  EXPECT_EQ(queue_->count(), 1U);
  EXPECT_TRUE(queue_->runOne());
  settle();
  EXPECT_EQ(queue_->count(), 0U);
  EXPECT_THAT(delivered_, ElementsAre(token));
}

TEST_F(QVInotifyNotificationsTest, DeliversAPostThatComesWhileADeliveryRuns) {
  int32_t token = 0;
  int deliveries = 0;
  ASSERT_EQ(notifications_->registerDispatch("name", token, queue_,
                                             [this, &deliveries](int32_t) {
                                               if (++deliveries > 1) return;
                                               post("name");
                                               settle();
                                               EXPECT_EQ(queue_->count(), 1U);
                                             }),
            QVNotifications::kStatusOK);
  post("name");
  EXPECT_TRUE(queue_->runOne());
  EXPECT_TRUE(queue_->runOne());
  EXPECT_EQ(deliveries, 2);
  settle();
  EXPECT_EQ(queue_->count(), 0U);
}

// What posters write may be read before it is there: then another delivery follows.
TEST_F(QVInotifyNotificationsTest, ShowsTheLastContentsToWhomPostersRace) {
  constexpr int kPosts = 500;
  int seen = 0;
  int32_t token = 0;
  ASSERT_EQ(
      notifications_->registerDispatch(
          "name", token, queue_, [&](int32_t) { std::ifstream(directory_ / "name") >> seen; }),
      QVNotifications::kStatusOK);
  std::thread poster([this] {
    for (int i = 1; i <= kPosts; ++i) {
      if (i % 2 == 0) {
        std::ofstream(directory_ / "name") << i;
      } else {
        std::ofstream(directory_ / "new") << i;
        std::filesystem::rename(directory_ / "new", directory_ / "name");
      }
    }
  });
  bool comes = true;
  while (seen != kPosts && comes) comes = queue_->runOne();
  poster.join();
  EXPECT_EQ(seen, kPosts);
}

TEST_F(QVInotifyNotificationsTest, DeliversAPostThatCouldNotBeEnqueuedAtOnce) {
  const int32_t token = add("name");
  queue_->refuseOne();
  // One event, and no other after it.
  std::filesystem::create_symlink("elsewhere", directory_ / "name");
  EXPECT_TRUE(queue_->runOne());
  EXPECT_THAT(delivered_, ElementsAre(token));
  EXPECT_THAT(log_.renderings(),
              ElementsAre("3[default] -[QVDirectoryWatcher tell:]: exception in the callback for "
                          "name: std::bad_alloc"));
}

TEST_F(QVInotifyNotificationsTest, FoldsEachRegistrationByItself) {
  const int32_t first = add("name");
  post("name");
  settle();
  const int32_t second = add("name");
  post("name");
  settle();
  EXPECT_EQ(queue_->count(), 2U);
  EXPECT_TRUE(queue_->runOne());
  EXPECT_TRUE(queue_->runOne());
  EXPECT_THAT(delivered_, ElementsAre(first, second));
}

TEST_F(QVInotifyNotificationsTest, TakesAFileThatWasThereForNoPost) {
  std::filesystem::create_directory(directory_);
  post("name");
  add("name");
  settle();
  EXPECT_EQ(queue_->count(), 0U);
}

TEST_F(QVInotifyNotificationsTest, StillRunsWhatWasEnqueuedBeforeTheEnd) {
  const int32_t cancelled = add("cancelled");
  const int32_t ended = add("ended");
  post("cancelled");
  settle();
  notifications_->cancel(cancelled);
  post("cancelled");
  post("ended");
  settle();
  notifications_ = nullptr;
  EXPECT_EQ(queue_->count(), 2U);
  EXPECT_TRUE(queue_->runOne());
  EXPECT_TRUE(queue_->runOne());
  EXPECT_THAT(delivered_, ElementsAre(cancelled, ended));
}

TEST_F(QVInotifyNotificationsTest, KeepsNoQueueByADeliveryThatNobodyRan) {
  auto queue = std::make_shared<QVHeldQueue>();
  const std::weak_ptr<QVHeldQueue> seen = queue;
  add("name", queue, delivered_);
  post("name");
  settle();
  EXPECT_EQ(queue->count(), 1U);
  queue = nullptr;
  EXPECT_FALSE(seen.expired());
  notifications_ = nullptr;
  EXPECT_TRUE(seen.expired());
}

TEST_F(QVInotifyNotificationsTest, EnqueuesNothingOnceItIsDestroyed) {
  add("name");
  notifications_ = nullptr;
  post("name");
  notifications_ = std::make_unique<QVInotifyNotifications>(log_, watcher_, directory_);
  settle();
  EXPECT_EQ(queue_->count(), 0U);
}

TEST_F(QVInotifyNotificationsTest, DeliversOnceWhenTheDirectoryWasDeleted) {
  const int32_t token = add("name");
  const int32_t other = add("other");
  std::filesystem::remove_all(directory_);
  EXPECT_TRUE(queue_->runOne());
  EXPECT_TRUE(queue_->runOne());
  settle();
  EXPECT_EQ(queue_->count(), 0U);
  EXPECT_THAT(delivered_, ElementsAre(token, other));
  EXPECT_THAT(
      log_.renderings(),
      ElementsAre(QVText("5[default] -[QVDirectoryWatcher followAnew:]: ", directory_.string(),
                         " was deleted or moved away: it is there again")));
  post("name");
  EXPECT_TRUE(queue_->runOne());
}

TEST_F(QVInotifyNotificationsTest, RefusesNamesThatNameNoFile) {
  int32_t token = -7;
  EXPECT_EQ(tryToAdd("a/b", token), QVNotifications::kStatusInvalidName);
  EXPECT_EQ(tryToAdd("..", token), QVNotifications::kStatusInvalidName);
  EXPECT_EQ(tryToAdd("", token), QVNotifications::kStatusInvalidName);
  EXPECT_EQ(tryToAdd(std::string(256, 'x'), token), QVNotifications::kStatusInvalidName);
  EXPECT_EQ(token, -7);
  EXPECT_FALSE(std::filesystem::exists(directory_));
  const std::string line = QVText(kRegistration, "no file can be called \"");
  EXPECT_THAT(log_.renderings(), ElementsAre(line + "a/b\"", line + "..\"", line + '"',
                                             line + std::string(256, 'x') + '"'));
}

TEST_F(QVInotifyNotificationsTest, TakesNamesOfTheGreatestLength) {
  const std::string name(255, 'x');
  const int32_t token = add(name);
  post(name);
  EXPECT_TRUE(queue_->runOne());
  EXPECT_THAT(delivered_, ElementsAre(token));
}

TEST_F(QVInotifyNotificationsTest, SaysWhyItsDirectoryCannotBeWatched) {
  std::ofstream(directory_) << "a file";
  int32_t token = -7;
  EXPECT_EQ(tryToAdd("name", token), QVNotifications::kStatusFailed);
  EXPECT_EQ(token, -7);
  EXPECT_THAT(log_.renderings(),
              ElementsAre(QVText(kRegistration, "cannot watch for notifications: ",
                                 directory_.string(), ": Not a directory")));
  std::filesystem::remove(directory_);
  EXPECT_GT(add("name"), 0);
}

}  // namespace
