// What files of the operating system have beyond what all file systems of the service do.

#include "platform/linux/output/QVPosixFileSystem.h"
#include "tests/support/QVTemporaryRoot.h"

#include <cerrno>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <sys/resource.h>
#include <sys/stat.h>

namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using testing::MatchesRegex;

// The process's umask while it lives.
class Umask {
 public:
  explicit Umask(mode_t mask) : before_(::umask(mask)) {}
  ~Umask() { ::umask(before_); }
  Umask(const Umask&) = delete;
  Umask& operator=(const Umask&) = delete;

 private:
  const mode_t before_;
};

// While it lives, files cannot become larger than this.
class FileSizeLimit {
 public:
  explicit FileSizeLimit(rlim_t bytes) : handler_(std::signal(SIGXFSZ, SIG_IGN)) {
    EXPECT_EQ(::getrlimit(RLIMIT_FSIZE, &before_), 0);
    const rlimit limit{.rlim_cur = bytes, .rlim_max = before_.rlim_max};
    EXPECT_EQ(::setrlimit(RLIMIT_FSIZE, &limit), 0);
  }
  ~FileSizeLimit() {
    EXPECT_EQ(::setrlimit(RLIMIT_FSIZE, &before_), 0);
    std::signal(SIGXFSZ, handler_);
  }
  FileSizeLimit(const FileSizeLimit&) = delete;
  FileSizeLimit& operator=(const FileSizeLimit&) = delete;

 private:
  void (*handler_)(int);
  rlimit before_{};
};

class QVPosixFileSystemTest : public testing::Test {
 protected:
  std::string path(const std::string& name) const { return (root_.logs() / name).string(); }
  std::vector<std::string> names() const {
    std::vector<std::string> names;
    for (const auto& entry : std::filesystem::directory_iterator(root_.logs())) {
      names.push_back(entry.path().filename().string());
    }
    return names;
  }
  std::string contents(const std::string& name) const {
    std::ifstream stream(path(name));
    return {std::istreambuf_iterator<char>(stream), {}};
  }
  mode_t mode(const std::string& name) const {
    struct stat status {};
    EXPECT_EQ(::stat(path(name).c_str(), &status), 0);
    return status.st_mode & mode_t{07777};
  }
  // What went wrong; empty where nothing did.
  std::string write(const std::string& name, std::string_view text) {
    const auto file = files_.makeAtomicFile(path(name));
    file->write(text);
    const auto error = file->commit();
    return error ? error->description() : "";
  }

  const QVTemporaryRoot root_;
  QVPosixFileSystem files_{root_.logs().string()};
};

TEST_F(QVPosixFileSystemTest, LetsTheUmaskDecideWhoReadsAFile) {
  {
    const Umask mask(022);
    EXPECT_EQ(write("everybody", "x"), "");
  }
  {
    const Umask mask(007);
    EXPECT_EQ(write("group", "x"), "");
  }
  EXPECT_EQ(mode("everybody"), mode_t{0644});
  EXPECT_EQ(mode("group"), mode_t{0640});
}

TEST_F(QVPosixFileSystemTest, WritesIntoAHiddenFileBesideThePlace) {
  const auto file = files_.makeAtomicFile(path("file.json"));
  file->write("x");
  EXPECT_THAT(names(), ElementsAre(MatchesRegex("\\.quietvox-[0-9a-f]{16}\\.tmp")));
  EXPECT_EQ(file->commit(), std::nullopt);
  EXPECT_THAT(names(), ElementsAre("file.json"));
}

TEST_F(QVPosixFileSystemTest, ReplacesALinkInsteadOfFollowingIt) {
  ASSERT_EQ(write("precious", "keep me"), "");
  std::filesystem::create_symlink(path("precious"), path("file.json"));
  std::filesystem::create_symlink(path("nowhere"), path("dangling.json"));
  EXPECT_EQ(write("file.json", "new"), "");
  EXPECT_EQ(write("dangling.json", "new"), "");
  EXPECT_FALSE(std::filesystem::is_symlink(path("file.json")));
  EXPECT_EQ(contents("file.json"), "new");
  EXPECT_EQ(contents("precious"), "keep me");
  EXPECT_FALSE(std::filesystem::exists(path("nowhere")));
}

TEST_F(QVPosixFileSystemTest, FollowsNoLinkInPlaceOfADirectory) {
  std::filesystem::create_directory(path("elsewhere"));
  for (const char* target : {"elsewhere", "nowhere"}) {
    std::filesystem::create_directory_symlink(path(target), path("link"));
    const auto error = files_.createDirectory(path("link/inside"), 0777);
    ASSERT_TRUE(error.has_value());
    EXPECT_EQ(error->description(), path("link: Too many levels of symbolic links"));
    EXPECT_EQ(write("link/file.json", "x"),
              path("link/file.json: Too many levels of symbolic links"));
    std::filesystem::remove(path("link"));
  }
  EXPECT_TRUE(std::filesystem::is_empty(path("elsewhere")));
  EXPECT_FALSE(std::filesystem::exists(path("nowhere")));
}

TEST_F(QVPosixFileSystemTest, WritesWhereItBeganAndNotWhereALinkIsPutMeanwhile) {
  std::filesystem::create_directory(path("directory"));
  std::filesystem::create_directory(path("elsewhere"));
  const auto file = files_.makeAtomicFile(path("directory/file.json"));
  std::filesystem::rename(path("directory"), path("moved"));
  std::filesystem::create_directory_symlink(path("elsewhere"), path("directory"));
  file->write("x");
  EXPECT_EQ(file->commit(), std::nullopt);
  EXPECT_TRUE(std::filesystem::is_empty(path("elsewhere")));
  EXPECT_EQ(contents("moved/file.json"), "x");
}

TEST_F(QVPosixFileSystemTest, TakesARootThatIsALink) {
  std::filesystem::create_directory(path("disk"));
  std::filesystem::create_directory_symlink(path("disk"), path("root"));
  QVPosixFileSystem files(path("root"));
  EXPECT_EQ(files.createDirectory(path("root/inside"), 0777), std::nullopt);
  EXPECT_TRUE(std::filesystem::is_directory(path("disk/inside")));
}

TEST_F(QVPosixFileSystemTest, MakesAMissingRootAndThoseAboveIt) {
  QVPosixFileSystem files(path("var/log"));
  EXPECT_EQ(files.createDirectory(path("var/log/inside"), 0777), std::nullopt);
  EXPECT_EQ(mode("var"), mode_t{0777});
  EXPECT_EQ(mode("var/log"), mode_t{0777});
  EXPECT_EQ(mode("var/log/inside"), mode_t{0777});
}

TEST_F(QVPosixFileSystemTest, RefusesWhatLiesElsewhere) {
  for (const std::string& place :
       {root_.state().string(), path("../elsewhere"), path("a/../../elsewhere"), path("a//b"),
        path("."), root_.logs().string() + "beside"}) {
    const auto error = files_.createDirectory(place, 0777);
    ASSERT_TRUE(error.has_value()) << place;
    EXPECT_EQ(error->code, EINVAL) << place;
    const auto failure = files_.makeAtomicFile(place + "/file")->commit();
    ASSERT_TRUE(failure.has_value()) << place;
    EXPECT_EQ(failure->code, EINVAL) << place;
  }
  EXPECT_EQ(files_.makeAtomicFile("file")->commit()->code, EINVAL);
}

TEST_F(QVPosixFileSystemTest, LeavesNothingWhereTheDiskTakesNoMore) {
  for (const std::size_t bytes : {std::size_t{5'000}, std::size_t{1'000'000}}) {
    // Found out when the last bytes are written, and in the middle.
    const FileSizeLimit limit(4'096);
    EXPECT_EQ(write("file.json", std::string(bytes, 'x')), path("file.json: File too large"));
  }
  EXPECT_THAT(names(), IsEmpty());
}

TEST_F(QVPosixFileSystemTest, KeepsTheOldFileWhereTheDiskTakesNoMore) {
  ASSERT_EQ(write("file.json", "old"), "");
  {
    const FileSizeLimit limit(4'096);
    EXPECT_EQ(write("file.json", std::string(5'000, 'x')), path("file.json: File too large"));
  }
  EXPECT_EQ(contents("file.json"), "old");
  EXPECT_THAT(names(), ElementsAre("file.json"));
}

TEST_F(QVPosixFileSystemTest, AnswersTheFirstThingThatWentWrong) {
  const FileSizeLimit limit(4'096);
  const std::string tooLong(256, 'n');
  EXPECT_EQ(write(tooLong, std::string(1'000'000, 'x')), path(tooLong).append(": File too large"));
}

// The kernel is told to write, and to forget, while the file grows.
TEST_F(QVPosixFileSystemTest, KeepsEveryByteOfALargeFile) {
  constexpr int kPieces = 400;
  std::string expected;
  const auto file = files_.makeAtomicFile(path("file.json"));
  for (int i = 0; i < kPieces; ++i) {
    const std::string piece(99'991, static_cast<char>('a' + i % 26));
    file->write(piece);
    expected += piece;
  }
  EXPECT_EQ(file->commit(), std::nullopt);
  EXPECT_TRUE(contents("file.json") == expected);
}

TEST_F(QVPosixFileSystemTest, SurvivesThatItsDirectoryIsRemoved) {
  std::filesystem::create_directory(path("directory"));
  const auto file = files_.makeAtomicFile(path("directory/file.json"));
  std::filesystem::remove_all(path("directory"));
  file->write("x");
  const auto error = file->commit();
  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->description(), path("directory/file.json: No such file or directory"));
}

TEST_F(QVPosixFileSystemTest, NamesThePlaceWhereNobodyMayMakeAnything) {
  // Not even root.
  QVPosixFileSystem files("/proc/self/quietvox");
  const auto error = files.createDirectory("/proc/self/quietvox/logs", 0777);
  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->description(), "/proc/self/quietvox: No such file or directory");
  QVPosixFileSystem process("/proc/self");
  EXPECT_TRUE(process.makeAtomicFile("/proc/self/file.json")->commit().has_value());
}

}  // namespace
