// The C header with which drivers publish: what it makes is read, whatever becomes of its user.

#include "client/quietvox_channels.h"
#include "platform/QVText.h"
#include "platform/linux/tally/QVMMVSource.h"
#include "tests/support/QVDaemonProcess.h"
#include "tests/support/QVDriverProcess.h"
#include "tests/support/QVSubprocess.h"
#include "tests/support/QVTemporaryRoot.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <string>
#include <thread>
#include <vector>

#include <gmock/gmock.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

using Names = std::vector<const char*>;

class QVChannelsHeaderTest : public testing::Test {
 protected:
  ~QVChannelsHeaderTest() override { quietvox_channels_close(&channels_, QUIETVOX_CHANNELS_KEEP); }

  std::string path(const std::string& group = "Speaker") const {
    return (root_.path() / group).string();
  }
  int create(const Names& subgroups, const Names& names, const std::string& group = "Speaker") {
    return quietvox_channels_create(&channels_, path(group).c_str(), subgroups.data(),
                                    subgroups.size(), names.data(), names.size());
  }
  std::vector<std::string> contents() const {
    QVChannelReadings readings;
    EXPECT_EQ(QVMMVSource(root_.path().string(), "Speaker").read(readings), 0);
    std::vector<std::string> contents;
    for (const auto& channel : readings.channels) {
      contents.push_back(QVText(channel.subgroup, ' ', channel.name, ' ', channel.value));
    }
    return contents;
  }
  // The names in the directory, those that only publishers see included.
  std::vector<std::string> files() const {
    std::vector<std::string> files;
    for (const auto& entry : std::filesystem::directory_iterator(root_.path())) {
      if (entry.is_regular_file()) files.push_back(entry.path().filename().string());
    }
    std::ranges::sort(files);
    return files;
  }
  std::vector<std::string> mmvdump() const {
    const auto output = QVSubprocess::run({QV_MMVDUMP, path()});
    EXPECT_EQ(output.status, 0) << output.text;
    std::vector<std::string> lines;
    std::istringstream stream(output.text);
    for (std::string line; std::getline(stream, line);) lines.push_back(line);
    return lines;
  }

  const QVTemporaryRoot root_;
  QuietVoxChannels channels_ = {};
};

TEST_F(QVChannelsHeaderTest, PublishesChannelsWithSubgroups) {
  ASSERT_EQ(create({"pcm0p", "pcm1p"}, {"frames", "underruns"}), 0);
  EXPECT_THAT(contents(), ElementsAre("pcm0p frames 0", "pcm1p frames 0", "pcm0p underruns 0",
                                      "pcm1p underruns 0"));
  quietvox_channels_add(&channels_, 0, 0, 480);
  quietvox_channels_add(&channels_, 0, 0, 480);
  quietvox_channels_add(&channels_, 1, 1, 1);
  EXPECT_THAT(contents(), ElementsAre("pcm0p frames 960", "pcm1p frames 0", "pcm0p underruns 0",
                                      "pcm1p underruns 1"));
  EXPECT_THAT(files(), ElementsAre("Speaker"));
}

TEST_F(QVChannelsHeaderTest, PublishesChannelsWithoutSubgroups) {
  ASSERT_EQ(create({}, {"frames", "underruns"}), 0);
  quietvox_channels_add(&channels_, 0, 1, 3);
  EXPECT_THAT(contents(), ElementsAre("(null) frames 0", "(null) underruns 3"));
}

TEST_F(QVChannelsHeaderTest, CountsNothingInOtherPlaces) {
  ASSERT_EQ(create({"a", "b"}, {"x"}), 0);
  quietvox_channels_add(&channels_, 2, 0, 1);
  quietvox_channels_add(&channels_, 0, 1, 1);
  quietvox_channels_add(&channels_, SIZE_MAX, SIZE_MAX, 1);
  EXPECT_THAT(contents(), ElementsAre("a x 0", "b x 0"));
  QuietVoxChannels nothing = {};
  quietvox_channels_add(&nothing, 0, 0, 1);
  EXPECT_EQ(quietvox_channels_close(&nothing, QUIETVOX_CHANNELS_REMOVE), 0);
}

TEST_F(QVChannelsHeaderTest, CountsAtOnceOnManyThreads) {
  constexpr int kThreads = 4;
  constexpr int kCounts = 20'000;
  ASSERT_EQ(create({}, {"frames"}), 0);
  std::vector<std::thread> threads;
  for (int thread = 0; thread < kThreads; ++thread) {
    threads.emplace_back([this] {
      for (int i = 0; i < kCounts; ++i) quietvox_channels_add(&channels_, 0, 0, 1);
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_THAT(contents(), ElementsAre(QVText("(null) frames ", kThreads * kCounts)));
}

TEST_F(QVChannelsHeaderTest, IsShownByMmvdump) {
  ASSERT_EQ(create({"pcm0p", "pcm1p"}, {"frames", "underruns"}), 0);
  quietvox_channels_add(&channels_, 0, 0, 48000);
  quietvox_channels_add(&channels_, 1, 1, UINT64_MAX);
  const auto lines = mmvdump();
  EXPECT_THAT(lines, testing::IsSupersetOf(
                         {std::string("Version    = 1"), QVText("Process    = ", ::getpid()),
                          std::string("  [1/136] instance = [0 or \"pcm0p\"]"),
                          std::string("  [1/216] instance = [1 or \"pcm1p\"]"),
                          std::string("       type=64-bit unsigned int (0x3), sem=counter (0x1), "
                                      "pad=0x0"),
                          std::string("       units=count"), std::string("       indom=1"),
                          std::string("  [1/504] frames[0 or \"pcm0p\"] = 48000"),
                          std::string("  [1/536] frames[1 or \"pcm1p\"] = 0"),
                          std::string("  [2/568] underruns[0 or \"pcm0p\"] = 0"),
                          std::string("  [2/600] underruns[1 or \"pcm1p\"] = "
                                      "18446744073709551615")}));
  EXPECT_THAT(lines, testing::Not(testing::Contains(testing::HasSubstr("Bad"))));
}

TEST_F(QVChannelsHeaderTest, IsShownByMmvdumpWithoutSubgroupsToo) {
  ASSERT_EQ(create({}, {"frames"}), 0);
  quietvox_channels_add(&channels_, 0, 0, 7);
  const auto lines = mmvdump();
  EXPECT_THAT(lines, testing::IsSupersetOf({"       (no indom)", "  [1/176] frames = 7"}));
  EXPECT_THAT(lines, testing::Not(testing::Contains(testing::HasSubstr("Bad"))));
}

TEST_F(QVChannelsHeaderTest, TakesNamesOfUpTo63Bytes) {
  const std::string longest(63, 'n');
  const std::string longer(64, 'n');
  ASSERT_EQ(create({longest.c_str()}, {longest.c_str()}), 0);
  EXPECT_THAT(contents(), ElementsAre(QVText(longest, ' ', longest, " 0")));
  EXPECT_EQ(quietvox_channels_close(&channels_, QUIETVOX_CHANNELS_REMOVE), 0);
  EXPECT_EQ(create({}, {"a", longer.c_str()}), -ENAMETOOLONG);
  EXPECT_EQ(create({longer.c_str()}, {"a"}), -ENAMETOOLONG);
  EXPECT_EQ(create({}, {"a"}, longer), -ENAMETOOLONG);
  EXPECT_THAT(files(), IsEmpty());
}

TEST_F(QVChannelsHeaderTest, RefusesWhatNobodyCouldRead) {
  EXPECT_EQ(create({}, {}), -EINVAL);
  EXPECT_EQ(create({}, {""}), -EINVAL);
  EXPECT_EQ(create({""}, {"a"}), -EINVAL);
  EXPECT_EQ(create({}, {"a"}, ""), -EINVAL);
  EXPECT_EQ(create({}, {"a"}, ".hidden"), -EINVAL);
  const Names many(QUIETVOX_CHANNELS_MAXIMUM + 1, "a");
  EXPECT_EQ(create({}, many), -E2BIG);
  EXPECT_EQ(create(Names(65, "a"), Names(64, "a")), -E2BIG);
  EXPECT_EQ(create({}, {"a"}, "missing/Speaker"), -ENOENT);
  EXPECT_EQ(create({}, {"a"}, std::string(QUIETVOX_CHANNELS_PATH_BYTES, 'x') + "/Speaker"),
            -ENAMETOOLONG);
  EXPECT_THAT(files(), IsEmpty());
  quietvox_channels_add(&channels_, 0, 0, 1);  // counts nothing, and does no harm
}

TEST_F(QVChannelsHeaderTest, PublishesAsManyAsAReaderTakes) {
  ASSERT_EQ(create(Names(64, "a"), Names(64, "b")), 0);
  quietvox_channels_add(&channels_, 63, 63, 5);
  const auto published = contents();
  ASSERT_EQ(published.size(), static_cast<std::size_t>(QUIETVOX_CHANNELS_MAXIMUM));
  EXPECT_EQ(published.back(), "a b 5");
}

TEST_F(QVChannelsHeaderTest, ReplacesAnEarlierFile) {
  std::ofstream(path()) << "something else";
  ASSERT_EQ(create({}, {"frames"}), 0);
  EXPECT_THAT(contents(), ElementsAre("(null) frames 0"));
  EXPECT_THAT(files(), ElementsAre("Speaker"));
}

TEST_F(QVChannelsHeaderTest, CannotReplaceADirectory) {
  std::filesystem::create_directories(path() + "/below");
  EXPECT_LT(create({}, {"frames"}), 0);
  EXPECT_THAT(files(), IsEmpty()) << "nothing is left of the attempt";
}

TEST_F(QVChannelsHeaderTest, RemovesOrKeepsItsFileAtTheEnd) {
  ASSERT_EQ(create({}, {"frames"}), 0);
  quietvox_channels_add(&channels_, 0, 0, 2);
  EXPECT_EQ(quietvox_channels_close(&channels_, QUIETVOX_CHANNELS_KEEP), 0);
  EXPECT_THAT(contents(), ElementsAre("(null) frames 2"));
  quietvox_channels_add(&channels_, 0, 0, 2);
  EXPECT_THAT(contents(), ElementsAre("(null) frames 2")) << "it was closed";
  ASSERT_EQ(create({}, {"frames"}), 0);
  EXPECT_EQ(quietvox_channels_close(&channels_, QUIETVOX_CHANNELS_REMOVE), 0);
  EXPECT_THAT(files(), IsEmpty());
  EXPECT_EQ(quietvox_channels_close(&channels_, QUIETVOX_CHANNELS_REMOVE), 0) << "once more";
}

TEST_F(QVChannelsHeaderTest, LeavesTheFileOfItsSuccessor) {
  ASSERT_EQ(create({}, {"frames"}), 0);
  QuietVoxChannels older = channels_;
  ASSERT_EQ(create({}, {"opens"}), 0);
  EXPECT_EQ(quietvox_channels_close(&older, QUIETVOX_CHANNELS_REMOVE), 0);
  EXPECT_THAT(contents(), ElementsAre("(null) opens 0"));
}

TEST_F(QVChannelsHeaderTest, LeavesAReadableFileWhenItsProcessIsKilled) {
  const pid_t driver = ::fork();
  ASSERT_GE(driver, 0);
  if (driver == 0) {
    QuietVoxChannels own;
    const char* const name = "frames";
    if (quietvox_channels_create(&own, path().c_str(), nullptr, 0, &name, 1) != 0) ::_exit(1);
    for (int i = 0; i < 1000; ++i) quietvox_channels_add(&own, 0, 0, 2);
    ::kill(::getpid(), SIGKILL);
  }
  int status = 0;
  ASSERT_EQ(::waitpid(driver, &status, 0), driver);
  ASSERT_TRUE(WIFSIGNALED(status));
  EXPECT_THAT(contents(), ElementsAre("(null) frames 2000"));
  EXPECT_THAT(mmvdump(), testing::Contains("  [1/176] frames = 2000"));
}

TEST_F(QVChannelsHeaderTest, TakesOverWhatACrashLeftInTheMaking) {
  const std::string made = path(".Speaker." + std::to_string(::getpid()));
  std::ofstream(made) << "half";
  ASSERT_EQ(create({}, {"frames"}), 0);
  EXPECT_THAT(files(), ElementsAre("Speaker"));
}

class QVDriverProgramTest : public QVChannelsHeaderTest {
 protected:
  static std::string program() { return QVDaemonProcess::program("qv-driver").string(); }
  static QVSubprocess::Output run(std::vector<std::string> arguments) {
    arguments.insert(arguments.begin(), program());
    return QVSubprocess::run(arguments);
  }
};

TEST_F(QVDriverProgramTest, CountsForSomeRounds) {
  const auto output = run({"--subgroup", "pcm0p", "--channel", "frames", "--channel", "underruns",
                           "--step", "480", "--rounds", "3", "--interval", "0", "--keep", path()});
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(output.text, "published\n");
  EXPECT_THAT(contents(), ElementsAre("pcm0p frames 1440", "pcm0p underruns 1440"));
}

TEST_F(QVDriverProgramTest, RemovesItsFileAtTheEnd) {
  EXPECT_EQ(run({"--rounds", "1", "--interval", "0", path()}).status, 0);
  EXPECT_THAT(files(), IsEmpty());
}

TEST_F(QVDriverProgramTest, CountsWhenItIsAskedTo) {
  QVDriverProcess driver(path(), {"--step", "5"});
  EXPECT_THAT(contents(), ElementsAre("(null) frames 0"));
  driver.count();
  EXPECT_THAT(contents(), ElementsAre("(null) frames 5"));
  driver.count();
  EXPECT_THAT(contents(), ElementsAre("(null) frames 10"));
  EXPECT_EQ(driver.end(), 0);
  EXPECT_THAT(files(), IsEmpty());
}

TEST_F(QVDriverProgramTest, RemovesItsFileWhenItIsToldToEnd) {
  QVDriverProcess driver(path());
  driver.signal(SIGTERM);
  EXPECT_EQ(driver.wait(), 0);
  EXPECT_THAT(files(), IsEmpty());
}

TEST_F(QVDriverProgramTest, LeavesItsFileWhenItIsKilled) {
  QVDriverProcess driver(path());
  driver.count();
  driver.signal(SIGKILL);
  EXPECT_EQ(driver.wait(), -SIGKILL);
  EXPECT_THAT(contents(), ElementsAre("(null) frames 1"));
}

TEST_F(QVDriverProgramTest, SaysWhatIsWrong) {
  EXPECT_EQ(
      run({path("missing/Speaker")}).text,
      "qv-driver: cannot publish " + path("missing/Speaker") + ": No such file or directory\n");
  EXPECT_EQ(run({path("missing/Speaker")}).status, 1);
  EXPECT_EQ(run({}).status, 2);
  EXPECT_EQ(run({"--rounds", "many", path()}).status, 2);
  EXPECT_EQ(run({"--rounds", "1000001", path()}).status, 2);
  EXPECT_EQ(run({"--unknown", "1", path()}).status, 2);
  EXPECT_EQ(run({path(), path()}).status, 2);
  EXPECT_EQ(run({path(), "--step"}).status, 2);
  const auto help = run({"--help"});
  EXPECT_EQ(help.status, 0);
  EXPECT_THAT(help.text, testing::StartsWith("usage: qv-driver "));
  EXPECT_THAT(files(), IsEmpty());
}

}  // namespace
