#include "platform/fake/QVFakeLog.h"
#include "platform/linux/watch/QVDirectoryWatcher.h"
#include "tests/support/QVDescriptorLimit.h"
#include "tests/support/QVTemporaryRoot.h"
#include "tests/unit/watch/QVOccurrences.h"

#include <atomic>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <memory>
#include <new>
#include <stdexcept>
#include <thread>
#include <utility>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

using Kind = QVDirectoryWatcher::Kind;
using Token = QVDirectoryWatcher::Token;

constexpr const char* kFunction = "[default] -[QVDirectoryWatcher followAnew:]: ";

class QVDirectoryWatcherTest : public testing::Test {
 protected:
  Token watch(const std::string& name, Kind kind, QVOccurrences& occurrences) {
    std::string reason;
    const Token token = watcher_.watch(
        {directory_, name, kind}, [&occurrences] { occurrences.happen(); }, reason);
    EXPECT_NE(token, QVDirectoryWatcher::kNoToken) << reason;
    return token;
  }
  // Everything that was done to the directory before has been told of. Watches of what may still
  // be told have to outlive the watcher.
  void settle() {
    const std::string name = "marker " + std::to_string(++markerCount_);
    const Token token = watch(name, Kind::posts, marker_);
    const std::size_t before = marker_.count();
    touch(name);
    EXPECT_TRUE(marker_.await(before + 1));
    watcher_.unwatch(token);
  }

  std::filesystem::path path(const std::string& name) const { return directory_ / name; }
  void touch(const std::string& name) const { std::ofstream(path(name), std::ios::app).flush(); }
  void write(const std::string& name, const std::string& text) const {
    std::ofstream(path(name)) << text;
  }
  // The directory is gone, and its parent too.
  void loseParent() const {
    const std::filesystem::path moved = root_.path() / "moved";
    std::filesystem::rename(root_.runtime(), moved);
    // Only what happens to the directory itself is heard of.
    std::filesystem::remove_all(moved / "notify");
  }
  std::string cannotWatch() const {
    return QVText('3', kFunction, "cannot watch a directory any more: ", directory_.string(),
                  ": No such file or directory");
  }
  std::string isThereAgain() const {
    return QVText('5', kFunction, directory_.string(),
                  " was deleted or moved away: it is there again");
  }
  static mode_t modeOf(const std::filesystem::path& path) {
    struct stat status {};
    EXPECT_EQ(::stat(path.c_str(), &status), 0);
    return status.st_mode & 07777U;
  }

  QVOccurrences marker_;
  QVOccurrences occurrences_;
  QVOccurrences others_;
  QVTemporaryRoot root_;
  const std::filesystem::path directory_ = root_.runtime() / "notify";
  QVFakeLog log_;
  QVDirectoryWatcher watcher_{log_, std::chrono::milliseconds(10)};
  int markerCount_ = 0;
};

TEST_F(QVDirectoryWatcherTest, MakesAMissingDirectoryThatItsGroupWritesAndAllMayWatch) {
  const mode_t before = ::umask(0077);
  watch("name", Kind::posts, occurrences_);
  ::umask(before);
  EXPECT_EQ(modeOf(directory_), 0775U);
}

TEST_F(QVDirectoryWatcherTest, LeavesTheModeOfADirectoryAsItIs) {
  std::filesystem::create_directory(directory_);
  ASSERT_EQ(::chmod(directory_.c_str(), 01731), 0);
  watch("name", Kind::posts, occurrences_);
  EXPECT_EQ(modeOf(directory_), 01731U);
}

TEST_F(QVDirectoryWatcherTest, SaysWhyADirectoryCannotBeWatched) {
  std::ofstream(directory_) << "a file";
  std::string reason;
  EXPECT_EQ(watcher_.watch(
                {directory_, "name", Kind::posts}, [] {}, reason),
            QVDirectoryWatcher::kNoToken);
  EXPECT_EQ(reason, directory_.string() + ": Not a directory");
  EXPECT_EQ(watcher_.watch(
                {directory_ / "below", "name", Kind::posts}, [] {}, reason),
            QVDirectoryWatcher::kNoToken);
  EXPECT_EQ(reason, (directory_ / "below").string() + ": Not a directory");
  const std::filesystem::path missing = root_.runtime() / "missing" / "notify";
  EXPECT_EQ(watcher_.watch(
                {missing, "name", Kind::posts}, [] {}, reason),
            QVDirectoryWatcher::kNoToken);
  EXPECT_EQ(reason, missing.string() + ": No such file or directory");

  // Once it can be, it is.
  std::filesystem::remove(directory_);
  watch("name", Kind::posts, occurrences_);
  touch("name");
  EXPECT_TRUE(occurrences_.await(1));
  EXPECT_THAT(log_.renderings(), IsEmpty());
}

TEST_F(QVDirectoryWatcherTest, SaysThatThereAreNoDescriptorsLeft) {
  std::string reason;
  {
    const QVDescriptorLimit noMore;
    EXPECT_EQ(watcher_.watch(
                  {directory_, "name", Kind::posts}, [] {}, reason),
              QVDirectoryWatcher::kNoToken);
  }
  EXPECT_EQ(reason, "inotify: Too many open files");

  // Once there are, it watches.
  watch("name", Kind::posts, occurrences_);
  touch("name");
  EXPECT_TRUE(occurrences_.await(1));
}

// ---- What is told of

// Answers a descriptor that stays open until the test has looked, or -1.
using Act = int (*)(const std::filesystem::path& file);

struct Deed {
  const char* name;
  Act act;
  bool isPost;
  bool changesContents;
  bool needsFile = true;  // beforehand
};

void PrintTo(const Deed& deed, std::ostream* stream) {
  *stream << deed.name;
}

int createFile(const std::filesystem::path& file) {
  std::ofstream(file).flush();
  return -1;
}
int linkFile(const std::filesystem::path& file) {
  std::filesystem::create_hard_link(file.parent_path() / "other", file);
  return -1;
}
int touchFile(const std::filesystem::path& file) {
  EXPECT_EQ(::utimensat(AT_FDCWD, file.c_str(), nullptr, 0), 0);
  return -1;
}
int writeFile(const std::filesystem::path& file) {
  std::ofstream(file, std::ios::app) << "text";
  return -1;
}
int beginWriting(const std::filesystem::path& file) {
  const int descriptor = ::open(file.c_str(), O_WRONLY | O_CLOEXEC);
  EXPECT_EQ(::write(descriptor, "text", 4), 4);
  return descriptor;
}
int replaceFile(const std::filesystem::path& file) {
  std::filesystem::rename(file.parent_path() / "other", file);
  return -1;
}
int readFile(const std::filesystem::path& file) {
  std::string word;
  std::ifstream(file) >> word;
  return -1;
}

const Deed kDeeds[] = {
    {"Creation", createFile, true, true, false},
    {"CreationOfALink", linkFile, true, true, false},
    {"Touching", touchFile, true, false},
    {"WritingInPlace", writeFile, true, true},
    {"WritingThatIsNotDone", beginWriting, true, false},
    {"AtomicReplacement", replaceFile, true, true},
    {"Reading", readFile, false, false},
};

class QVDeedTest : public QVDirectoryWatcherTest, public testing::WithParamInterface<Deed> {
 protected:
  void expectTold(Kind kind, bool isTold) {
    std::filesystem::create_directory(directory_);
    if (GetParam().needsFile) write("file", "text");
    write("other", "text");
    watch("file", kind, occurrences_);
    const int descriptor = GetParam().act(path("file"));
    if (isTold) {
      EXPECT_TRUE(occurrences_.await(1));
    } else {
      settle();
      EXPECT_EQ(occurrences_.count(), 0U);
    }
    if (descriptor >= 0) ::close(descriptor);
  }
};

TEST_P(QVDeedTest, IsToldOfWhereItIsAPost) {
  expectTold(Kind::posts, GetParam().isPost);
}

TEST_P(QVDeedTest, IsToldOfWhereItChangesContents) {
  expectTold(Kind::contents, GetParam().changesContents);
}

INSTANTIATE_TEST_SUITE_P(All, QVDeedTest, testing::ValuesIn(kDeeds),
                         [](const auto& deed) { return deed.param.name; });

TEST_F(QVDirectoryWatcherTest, TakesARemovalForAChangeAndNoPost) {
  for (const bool isMoved : {false, true}) {
    std::filesystem::create_directories(directory_);
    write("file", "text");
    const Token post = watch("file", Kind::posts, occurrences_);
    const Token change = watch("file", Kind::contents, others_);
    const std::size_t before = others_.count();
    if (isMoved) {
      std::filesystem::rename(path("file"), root_.path() / "moved");
    } else {
      std::filesystem::remove(path("file"));
    }
    EXPECT_TRUE(others_.await(before + 1));
    settle();
    EXPECT_EQ(occurrences_.count(), 0U);
    watcher_.unwatch(post);
    watcher_.unwatch(change);
  }
}

TEST_F(QVDirectoryWatcherTest, TellsOfTheNamedFileAlone) {
  watch("file", Kind::posts, occurrences_);
  touch("file.new");
  touch("fil");
  std::filesystem::create_directory(path("directory"));
  settle();
  EXPECT_EQ(occurrences_.count(), 0U);
}

TEST_F(QVDirectoryWatcherTest, TakesNoDirectoryForTheFile) {
  watch("file", Kind::posts, occurrences_);
  std::filesystem::create_directory(path("file"));
  settle();
  EXPECT_EQ(occurrences_.count(), 0U);
}

TEST_F(QVDirectoryWatcherTest, TellsAllWatchesOfAFileAndOfTwoDirectories) {
  watch("file", Kind::posts, occurrences_);
  watch("file", Kind::posts, others_);
  std::string reason;
  ASSERT_NE(watcher_.watch(
                {root_.state(), "file", Kind::posts}, [this] { marker_.happen(); }, reason),
            QVDirectoryWatcher::kNoToken);
  touch("file");
  EXPECT_TRUE(occurrences_.await(1));
  EXPECT_TRUE(others_.await(1));
  EXPECT_EQ(marker_.count(), 0U);
  std::ofstream(root_.state() / "file").flush();
  EXPECT_TRUE(marker_.await(1));
}

TEST_F(QVDirectoryWatcherTest, TellsTheOthersWhereACallbackFails) {
  std::string reason;
  const Token failing = watcher_.watch(
      {directory_, "file", Kind::posts}, [] { throw std::runtime_error("out of order"); }, reason);
  watch("file", Kind::posts, occurrences_);
  touch("file");
  EXPECT_TRUE(occurrences_.await(1));
  settle();
  const auto lines = log_.renderings();
  EXPECT_THAT(lines, testing::Each("3[default] -[QVDirectoryWatcher tell:]: exception in the "
                                   "callback for file: out of order"));
  EXPECT_THAT(lines, testing::Not(IsEmpty()));
  watcher_.unwatch(failing);
  const std::size_t before = occurrences_.count();
  touch("file");
  EXPECT_TRUE(occurrences_.await(before + 1));
}

TEST_F(QVDirectoryWatcherTest, TellsAgainWhereACallbackFailed) {
  std::string reason;
  ASSERT_NE(watcher_.watch(
                {directory_, "file", Kind::posts},
                [this, isFirst = true]() mutable {
                  if (std::exchange(isFirst, false)) throw std::bad_alloc();
                  occurrences_.happen();
                },
                reason),
            QVDirectoryWatcher::kNoToken);
  // One event, and no other after it.
  std::filesystem::create_symlink("elsewhere", path("file"));
  EXPECT_TRUE(occurrences_.await(1));
}

// ---- The life of a watch

TEST_F(QVDirectoryWatcherTest, TellsNothingOnceAWatchHasEnded) {
  const Token ended = watch("file", Kind::posts, occurrences_);
  watch("file", Kind::posts, others_);
  watcher_.unwatch(ended);
  watcher_.unwatch(ended);
  watcher_.unwatch(QVDirectoryWatcher::kNoToken);
  touch("file");
  EXPECT_TRUE(others_.await(1));
  settle();
  EXPECT_EQ(occurrences_.count(), 0U);
}

TEST_F(QVDirectoryWatcherTest, WatchesADirectoryAgainThatNobodyWatchedMeanwhile) {
  watcher_.unwatch(watch("file", Kind::posts, occurrences_));
  std::filesystem::remove_all(directory_);
  watch("file", Kind::posts, others_);
  touch("file");
  EXPECT_TRUE(others_.await(1));
  EXPECT_EQ(occurrences_.count(), 0U);
  EXPECT_THAT(log_.renderings(), IsEmpty());
}

TEST_F(QVDirectoryWatcherTest, LetsACallbackEndItsWatchAndBeginAnother) {
  std::atomic<Token> own = QVDirectoryWatcher::kNoToken;
  std::string reason;
  own = watcher_.watch(
      {directory_, "first", Kind::posts},
      [this, &own] {
        watcher_.unwatch(own);
        watch("second", Kind::posts, others_);
        occurrences_.happen();
      },
      reason);
  touch("first");
  ASSERT_TRUE(occurrences_.await(1));
  touch("first");
  touch("second");
  EXPECT_TRUE(others_.await(1));
  EXPECT_EQ(occurrences_.count(), 1U);
}

// Uses the watcher as it goes, which would never end under the watcher's lock.
class Caller {
 public:
  Caller(QVDirectoryWatcher& watcher, QVOccurrences& gone) : watcher_(&watcher), gone_(&gone) {}
  ~Caller() {
    watcher_->unwatch(QVDirectoryWatcher::kNoToken);
    gone_->happen();
  }
  Caller(const Caller&) = delete;
  Caller& operator=(const Caller&) = delete;

 private:
  QVDirectoryWatcher* watcher_;
  QVOccurrences* gone_;
};

TEST_F(QVDirectoryWatcherTest, DestroysCallbacksWithoutItsLock) {
  const auto add = [this](const std::filesystem::path& directory) {
    std::string reason;
    return watcher_.watch(
        {directory, "file", Kind::posts}, [caller = std::make_shared<Caller>(watcher_, others_)] {},
        reason);
  };
  watcher_.unwatch(add(directory_));
  EXPECT_EQ(others_.count(), 1U);
  EXPECT_EQ(add(root_.runtime() / "missing" / "notify"), QVDirectoryWatcher::kNoToken);
  EXPECT_EQ(others_.count(), 2U);
}

TEST_F(QVDirectoryWatcherTest, KeepsARunningCallbackUntilItHasEnded) {
  QVOccurrences begun;
  QVOccurrences mayEnd;
  std::string reason;
  const Token token = watcher_.watch(
      {directory_, "file", Kind::posts},
      [&begun, &mayEnd, caller = std::make_shared<Caller>(watcher_, others_)] {
        begun.happen();
        EXPECT_TRUE(mayEnd.await(1));
      },
      reason);
  touch("file");
  ASSERT_TRUE(begun.await(1));
  watcher_.unwatch(token);
  EXPECT_EQ(others_.count(), 0U);
  mayEnd.happen();
  EXPECT_TRUE(others_.await(1));
  EXPECT_EQ(begun.count(), 1U);
}

// ---- When changes cannot be told apart

TEST_F(QVDirectoryWatcherTest, TellsEveryWatchWhenTheKernelsQueueOverflowed) {
  long limit = 0;
  std::ifstream("/proc/sys/fs/inotify/max_queued_events") >> limit;
  ASSERT_GT(limit, 0);
  QVOccurrences mayGoOn;
  std::string reason;
  ASSERT_NE(watcher_.watch(
                {directory_, "hold", Kind::posts},
                [this, &mayGoOn] {
                  marker_.happen();
                  EXPECT_TRUE(mayGoOn.await(1));
                },
                reason),
            QVDirectoryWatcher::kNoToken);
  watch("late", Kind::posts, occurrences_);
  watch("later", Kind::contents, others_);
  touch("hold");
  ASSERT_TRUE(marker_.await(1));
  // By turns, since the same event twice in a row is one.
  write("a", "");
  write("b", "");
  for (long i = 0; i < limit; ++i) {
    ASSERT_EQ(::utimensat(AT_FDCWD, path(i % 2 == 0 ? "a" : "b").c_str(), nullptr, 0), 0);
  }
  touch("late");
  write("later", "text");
  EXPECT_EQ(occurrences_.count(), 0U);
  mayGoOn.happen();
  EXPECT_TRUE(occurrences_.await(1));
  EXPECT_TRUE(others_.await(1));
  const std::size_t before = occurrences_.count();
  touch("late");
  EXPECT_TRUE(occurrences_.await(before + 1));
}

TEST_F(QVDirectoryWatcherTest, MakesADeletedDirectoryAnewAndTellsEveryWatchOnce) {
  watch("file", Kind::posts, occurrences_);
  watch("other", Kind::contents, others_);
  std::filesystem::remove_all(directory_);
  ASSERT_TRUE(occurrences_.await(1));
  ASSERT_TRUE(others_.await(1));
  EXPECT_EQ(modeOf(directory_), 0775U);
  settle();
  EXPECT_EQ(occurrences_.count(), 1U);
  EXPECT_EQ(others_.count(), 1U);
  EXPECT_THAT(log_.renderings(), ElementsAre(isThereAgain()));
  touch("file");
  EXPECT_TRUE(occurrences_.await(2));
}

TEST_F(QVDirectoryWatcherTest, MakesAMovedDirectoryAnewAndForgetsTheOldOne) {
  watch("file", Kind::posts, occurrences_);
  const std::filesystem::path moved = root_.runtime() / "moved";
  std::filesystem::rename(directory_, moved);
  ASSERT_TRUE(occurrences_.await(1));
  std::ofstream(moved / "file").flush();
  settle();
  EXPECT_EQ(occurrences_.count(), 1U);
  EXPECT_THAT(log_.renderings(), ElementsAre(isThereAgain()));
  touch("file");
  EXPECT_TRUE(occurrences_.await(2));
}

TEST_F(QVDirectoryWatcherTest, FollowsADirectoryThatWasPutInTheOldOnesPlace) {
  watch("file", Kind::posts, occurrences_);
  std::filesystem::create_directory(root_.runtime() / "new");
  std::filesystem::rename(directory_, root_.runtime() / "moved");
  std::error_code error;
  std::filesystem::rename(root_.runtime() / "new", directory_, error);
  ASSERT_TRUE(occurrences_.await(1));
  touch("file");
  EXPECT_TRUE(occurrences_.await(2));
}

TEST_F(QVDirectoryWatcherTest, MakesADirectoryAnewOnceItsParentIsThere) {
  watch("file", Kind::posts, occurrences_);
  watch("other", Kind::contents, others_);
  loseParent();
  ASSERT_TRUE(others_.await(1));
  EXPECT_THAT(log_.renderings(), ElementsAre(cannotWatch()));
  // All are told of what they may have missed.
  std::filesystem::create_directory(root_.runtime());
  EXPECT_TRUE(occurrences_.await(2));
  EXPECT_TRUE(others_.await(2));
  settle();
  EXPECT_EQ(occurrences_.count(), 2U);
  EXPECT_THAT(log_.renderings(), ElementsAre(cannotWatch(), isThereAgain()));
  touch("file");
  EXPECT_TRUE(occurrences_.await(3));
}

TEST_F(QVDirectoryWatcherTest, GivesUpADirectoryThatNobodyWatchesAnyMore) {
  const Token token = watch("file", Kind::posts, occurrences_);
  loseParent();
  ASSERT_TRUE(occurrences_.await(1));
  watcher_.unwatch(token);
  std::filesystem::create_directory(root_.runtime());
  std::string reason;
  ASSERT_NE(watcher_.watch(
                {root_.state(), "file", Kind::posts}, [this] { others_.happen(); }, reason),
            QVDirectoryWatcher::kNoToken);
  std::ofstream(root_.state() / "file").flush();
  EXPECT_TRUE(others_.await(1));
  EXPECT_FALSE(std::filesystem::exists(directory_));
}

TEST_F(QVDirectoryWatcherTest, TellsOfADirectoryThatANewWatchRegained) {
  QVDirectoryWatcher watcher(log_, std::chrono::minutes(10));
  std::string reason;
  ASSERT_NE(watcher.watch(
                {directory_, "file", Kind::posts}, [this] { occurrences_.happen(); }, reason),
            QVDirectoryWatcher::kNoToken);
  loseParent();
  ASSERT_TRUE(occurrences_.await(1));
  EXPECT_THAT(log_.renderings(), ElementsAre(cannotWatch()));
  std::filesystem::create_directory(root_.runtime());
  ASSERT_NE(watcher.watch(
                {directory_, "other", Kind::posts}, [this] { others_.happen(); }, reason),
            QVDirectoryWatcher::kNoToken);
  EXPECT_TRUE(occurrences_.await(2));
  EXPECT_THAT(log_.renderings(), ElementsAre(cannotWatch(), isThereAgain()));
  touch("file");
  EXPECT_TRUE(occurrences_.await(3));
}

TEST_F(QVDirectoryWatcherTest, IsUsedByManyThreads) {
  std::vector<std::thread> threads;
  for (int thread = 0; thread < 4; ++thread) {
    threads.emplace_back([this, thread] {
      for (int i = 0; i < 50; ++i) {
        const std::string name = "file " + std::to_string(thread);
        QVOccurrences own;
        QVOccurrences ended;
        std::string reason;
        const Token token = watcher_.watch(
            {directory_, name, Kind::posts},
            [&own, caller = std::make_shared<Caller>(watcher_, ended)] { own.happen(); }, reason);
        touch(name);
        EXPECT_TRUE(own.await(1));
        watcher_.unwatch(token);
        EXPECT_TRUE(ended.await(1));
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
}

}  // namespace
