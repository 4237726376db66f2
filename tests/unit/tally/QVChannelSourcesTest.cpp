// The files behind sources of channels: what is read, and what is refused.

#include "platform/QVText.h"
#include "platform/linux/tally/QVKernelText.h"
#include "platform/linux/tally/QVKernelTextSource.h"
#include "platform/linux/tally/QVMMVFormat.h"
#include "platform/linux/tally/QVMMVSource.h"
#include "tests/support/QVTemporaryRoot.h"
#include "tests/unit/tally/QVPublisher.h"
#include "tests/unit/tally/QVTestMMV.h"

#include <atomic>
#include <cerrno>
#include <filesystem>
#include <fstream>
#include <string>
#include <thread>
#include <vector>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

namespace {

using testing::AnyOf;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::IsSupersetOf;

class QVChannelSourcesTest : public testing::Test {
 protected:
  std::string path(const std::string& name = "Speaker") const {
    return (root_.path() / name).string();
  }
  void write(const std::string& bytes, const std::string& name = "Speaker") const {
    QVPublishBytes(path(name), bytes);
  }
  int read(const QVChannelSource& source) {
    readings_.emplace();
    return source.read(*readings_);
  }
  int readMMV() { return read(QVMMVSource(root_.path().string(), "Speaker")); }
  int readDescribed(QVKernelTextSource::Description description) {
    description.group = "Speaker";
    return read(text_.emplace(std::move(description)));
  }
  int readText(const std::string& file) {
    return readDescribed({.group = {}, .subgroup = {}, .file = file, .channels = {}});
  }

  // "SUBGROUP NAME VALUE" of each channel that was read.
  std::vector<std::string> contents() const {
    std::vector<std::string> contents;
    for (const auto& channel : readings_->channels) {
      contents.push_back(QVText(channel.subgroup, ' ', channel.name, ' ', channel.value));
    }
    return contents;
  }

  // What is in the place of the file, and is none.
  void putFIFO() const { ASSERT_EQ(::mkfifo(path().c_str(), 0600), 0); }
  void putSocket() const {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    ASSERT_LT(path().size(), sizeof address.sun_path);
    path().copy(address.sun_path, sizeof address.sun_path - 1);
    const int bound = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    ASSERT_EQ(::bind(bound, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    ::close(bound);
  }

  const QVTemporaryRoot root_;
  std::optional<QVKernelTextSource> text_;  // the readings point into it
  std::optional<QVChannelReadings> readings_;
};

const QVTestMMV kFrames{.subgroups = {"left"}, .metrics = {{"frames", {1}, kUnsigned64, true}}};

TEST_F(QVChannelSourcesTest, ReadsAPublishedFile) {
  write(kFrames.bytes());
  EXPECT_EQ(readMMV(), 0);
  EXPECT_THAT(contents(), ElementsAre("left frames 1"));
  EXPECT_THAT(readings_->subgroups, ElementsAre("left"));
}

TEST_F(QVChannelSourcesTest, ReadsWhatIsThereNow) {
  const QVMMVSource source(root_.path().string(), "Speaker");
  EXPECT_EQ(read(source), ENOENT);
  write(kFrames.bytes());
  EXPECT_EQ(read(source), 0);
  write(QVTestMMV{.metrics = {{"opens", {2}}}, .generation = 8}.bytes());
  EXPECT_EQ(read(source), 0);
  EXPECT_THAT(contents(), ElementsAre("(null) opens 2"));
  std::filesystem::remove(path());
  EXPECT_EQ(read(source), ENOENT);
}

TEST_F(QVChannelSourcesTest, RefusesWhatIsNoRegularFile) {
  std::filesystem::create_directory(path());
  EXPECT_EQ(readMMV(), EINVAL);
  EXPECT_EQ(readText(path()), EINVAL);
  std::filesystem::remove(path());
  putFIFO();  // nobody writes to it
  EXPECT_EQ(readMMV(), EINVAL);
  EXPECT_EQ(readText(path()), EINVAL);
  std::filesystem::remove(path());
  putSocket();
  EXPECT_EQ(readMMV(), EINVAL);
  EXPECT_EQ(readText(path()), EINVAL);
  EXPECT_EQ(readText("/dev/null"), EINVAL);
}

TEST_F(QVChannelSourcesTest, DoesNotFollowALinkThatAPublisherMade) {
  write(kFrames.bytes(), "elsewhere");
  std::filesystem::create_symlink(path("elsewhere"), path());
  EXPECT_EQ(readMMV(), ELOOP);
}

TEST_F(QVChannelSourcesTest, FollowsALinkThatTheAdministratorNamed) {
  write("frames: 1\n", "elsewhere");
  std::filesystem::create_symlink(path("elsewhere"), path());
  EXPECT_EQ(readText(path()), 0);
  EXPECT_THAT(contents(), ElementsAre("(null) frames 1"));
}

TEST_F(QVChannelSourcesTest, FindsSeveralNamesOfALineAndSeveralLinesOfAName) {
  write("b: 1\nother: 2\na: 3\nb: 4\n");
  EXPECT_EQ(readDescribed(
                {.group = {},
                 .subgroup = {},
                 .file = path(),
                 .channels = {{{"first", "b"}, {"none", "c"}, {"second", "a"}, {"third", "b"}}}}),
            0);
  EXPECT_THAT(contents(), ElementsAre("(null) first 1", "(null) third 1", "(null) second 3",
                                      "(null) first 4", "(null) third 4"));
}

TEST_F(QVChannelSourcesTest, ReadsNoMoreChannelsThanASetHoldsAndALineHas) {
  std::string lines;
  for (std::size_t i = 0; i < 2 * QVChannelSource::kMaximumChannels; ++i) lines += "k 1\n";
  write(lines);
  EXPECT_EQ(readText(path()), 0);
  EXPECT_EQ(readings_->channels.size(), QVChannelSource::kMaximumChannels + 1);
  EXPECT_EQ(readDescribed({.group = {},
                           .subgroup = {},
                           .file = path(),
                           .channels = {{{"a", "k"}, {"b", "k"}, {"c", "k"}}}}),
            0);
  EXPECT_EQ(readings_->channels.size(), QVChannelSource::kMaximumChannels + 2);
}

TEST_F(QVChannelSourcesTest, RefusesFilesThatAreTooLarge) {
  write(kFrames.bytes());
  std::filesystem::resize_file(path(), QVMMVFormat::kMaximumBytes);
  EXPECT_EQ(readMMV(), 0) << "zeros behind the sections do no harm";
  std::filesystem::resize_file(path(), QVMMVFormat::kMaximumBytes + 1);
  EXPECT_EQ(readMMV(), EFBIG);
  std::filesystem::resize_file(path(), std::uintmax_t{1} << 40);  // has hardly any blocks
  EXPECT_EQ(readMMV(), EFBIG);
  EXPECT_EQ(readText(path()), EFBIG);
}

TEST_F(QVChannelSourcesTest, GivesUpAFileThatStaysUnfinished) {
  std::string bytes = kFrames.bytes();
  QVPatch(bytes, 16, uint64_t{8});
  write(bytes);
  EXPECT_EQ(readMMV(), EAGAIN);
}

// A publisher that writes its file anew in its place, again and again: what is read is of one
// generation. The cells and the generation are the same number.
TEST_F(QVChannelSourcesTest, NeverMixesGenerations) {
  constexpr uint64_t kGenerations = 20'000;
  QVTestMMV file{.metrics = {{"a", {1}}, {"b", {1}}}, .generation = 1};
  // Other pages lie between the two cells, so that they are not copied at once.
  for (int i = 0; i < 400; ++i) file.metrics.insert(file.metrics.end() - 1, {"filler", {0}});
  write(file.bytes());
  const int descriptor = ::open(path().c_str(), O_WRONLY | O_CLOEXEC);
  ASSERT_GE(descriptor, 0);
  std::atomic<bool> done{false};
  std::thread publisher([&] {
    const auto put = [descriptor](std::size_t offset, uint64_t number) {
      EXPECT_EQ(::pwrite(descriptor, &number, sizeof number, static_cast<off_t>(offset)), 8);
    };
    for (uint64_t generation = 2; generation <= kGenerations; ++generation) {
      put(8, generation);
      put(file.valueAt(0), generation);
      put(file.valueAt(401), generation);
      put(16, generation);
    }
    done = true;
  });
  std::size_t readings = 0;
  bool last = false;
  do {
    last = done;
    const int error = readMMV();
    EXPECT_THAT(error, AnyOf(0, EAGAIN));
    if (error != 0) continue;
    ++readings;
    EXPECT_EQ(readings_->channels.front().value, readings_->channels.back().value);
  } while (!last);
  publisher.join();
  ::close(descriptor);
  EXPECT_EQ(readings_->channels.back().value, static_cast<int64_t>(kGenerations));
  EXPECT_GT(readings, 0U);
}

TEST_F(QVChannelSourcesTest, SurvivesAFileThatShrinksWhileItIsRead) {
  constexpr int kRounds = 5'000;
  const std::string bytes = kFrames.bytes();
  write(bytes);
  std::atomic<bool> done{false};
  std::thread publisher([&] {
    const int descriptor = ::open(path().c_str(), O_WRONLY | O_CLOEXEC);
    for (int round = 0; round < kRounds; ++round) {
      EXPECT_EQ(::ftruncate(descriptor, round % 2 == 0 ? 0 : 100), 0);
      EXPECT_EQ(::pwrite(descriptor, bytes.data(), bytes.size(), 0),
                static_cast<ssize_t>(bytes.size()));
    }
    ::close(descriptor);
    done = true;
  });
  bool last = false;
  do {
    last = done;
    EXPECT_THAT(readMMV(), AnyOf(0, EBADMSG, EAGAIN));
  } while (!last);
  publisher.join();
  EXPECT_EQ(readMMV(), 0);
}

TEST_F(QVChannelSourcesTest, TakesEveryLineThatCounts) {
  write(
      "state: RUNNING\nowner_pid   : 77\ntrigger_time: 12.345\n-----\nhw_ptr      : 4096\n"
      "xruns 2\nhw_ptr: 5");
  EXPECT_EQ(readText(path()), 0);
  EXPECT_THAT(contents(), ElementsAre("(null) owner_pid 77", "(null) hw_ptr 4096", "(null) xruns 2",
                                      "(null) hw_ptr 5"));
  EXPECT_THAT(readings_->subgroups, ElementsAre(std::nullopt));
}

TEST_F(QVChannelSourcesTest, TakesTheLinesThatTheConfigurationNames) {
  write("hw_ptr: 4096\nxruns: 2\nappl_ptr: 5\nhw_ptr: 1\n");
  EXPECT_EQ(readDescribed({.group = {},
                           .subgroup = "pcm0p",
                           .file = path(),
                           .channels = {{{"again", "hw_ptr"},
                                         {"frames", "hw_ptr"},
                                         {"none", "missing"},
                                         {"underruns", "xruns"}}}}),
            0);
  EXPECT_THAT(contents(), ElementsAre("pcm0p again 4096", "pcm0p frames 4096", "pcm0p underruns 2",
                                      "pcm0p again 1", "pcm0p frames 1"));
  EXPECT_THAT(readings_->subgroups, ElementsAre("pcm0p"));
}

TEST_F(QVChannelSourcesTest, FindsNoChannelsInAFileWithoutThem) {
  write("closed\n");
  EXPECT_EQ(readText(path()), 0);
  EXPECT_THAT(contents(), IsEmpty());
  EXPECT_THAT(readings_->subgroups, ElementsAre(std::nullopt)) << "but it is published";
  write("");
  EXPECT_EQ(readText(path()), 0);
  EXPECT_THAT(contents(), IsEmpty());
}

TEST_F(QVChannelSourcesTest, SaysThatATextIsMissing) {
  EXPECT_EQ(readText(path()), ENOENT);
  write("a 1");
  EXPECT_EQ(readText(path() + "/below"), ENOTDIR);
}

TEST_F(QVChannelSourcesTest, ReadsTextsUpToTheirLimit) {
  std::string text = "first: 1\n";
  text.append(QVKernelText::kMaximumBytes - text.size() - 8, '\n').append("last: 2\n");
  ASSERT_EQ(text.size(), QVKernelText::kMaximumBytes);
  write(text);
  EXPECT_EQ(readText(path()), 0);
  EXPECT_THAT(contents(), ElementsAre("(null) first 1", "(null) last 2"));
  write(text + '\n');
  EXPECT_EQ(readText(path()), EFBIG);
}

// The kernel's own files say that they are empty, and are longer than one read gives.
TEST_F(QVChannelSourcesTest, ReadsTheKernelsFiles) {
  ASSERT_EQ(std::filesystem::file_size("/proc/self/status"), 0U);
  EXPECT_EQ(
      readDescribed({.group = {},
                     .subgroup = {},
                     .file = "/proc/self/status",
                     .channels = {{{"pid", "Pid"}, {"switches", "voluntary_ctxt_switches"}}}}),
      0);
  ASSERT_EQ(readings_->channels.size(), 2U);
  EXPECT_EQ(contents().front(), QVText("(null) pid ", ::getpid()));
  EXPECT_EQ(readText("/proc/vmstat"), 0);
  EXPECT_GT(readings_->channels.size(), 50U);
  EXPECT_EQ(readText("/proc/self/smaps"), 0);
  EXPECT_GT(readings_->text.size(), std::size_t{16} * 1024);
}

TEST_F(QVChannelSourcesTest, SaysThatAFileMayNotBeRead) {
  // Where every file may be read, the kernel still says no to this one: it is for writing alone.
  EXPECT_THAT(readText("/proc/self/clear_refs"), AnyOf(EACCES, EINVAL, EIO));
}

}  // namespace
