#include "platform/fake/QVFakeFileSystem.h"
#include "platform/linux/output/QVPosixFileSystem.h"
#include "tests/support/QVTemporaryRoot.h"

#include <filesystem>
#include <fstream>
#include <iterator>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <sys/stat.h>

namespace {

using testing::ElementsAre;
using testing::EndsWith;
using testing::IsEmpty;

class FakeFileSystemHarness {
 public:
  QVFileSystem& files() { return files_; }
  std::string root() const { return files_.diagnosticLogRoot(); }
  void makeRoot() { EXPECT_EQ(files_.createDirectory(root(), 0755), std::nullopt); }
  std::optional<std::string> contents(const std::string& path) { return files_.contents(path); }
  std::optional<uint32_t> permissions(const std::string& path) { return files_.permissions(path); }
  // All files below the root, hidden ones too.
  std::vector<std::string> allFiles() const { return files_.files(); }
  // A symbolic link to a directory elsewhere; what lies there.
  void addLink(const std::string& path) { files_.addLink(path); }
  std::vector<std::string> filesBehindLinks() const { return {}; }

 private:
  QVFakeFileSystem files_;
};

class PosixFileSystemHarness {
 public:
  PosixFileSystemHarness() : umask_(::umask(077)) { std::filesystem::remove(root_.logs()); }
  ~PosixFileSystemHarness() { ::umask(umask_); }
  PosixFileSystemHarness(const PosixFileSystemHarness&) = delete;
  PosixFileSystemHarness& operator=(const PosixFileSystemHarness&) = delete;

  QVFileSystem& files() { return files_; }
  std::string root() const { return files_.diagnosticLogRoot(); }
  void makeRoot() { std::filesystem::create_directory(root()); }
  std::optional<std::string> contents(const std::string& path) {
    std::ifstream stream(path);
    if (!std::filesystem::is_regular_file(path) || !stream) return std::nullopt;
    return std::string(std::istreambuf_iterator<char>(stream), {});
  }
  std::optional<uint32_t> permissions(const std::string& path) {
    if (!std::filesystem::is_directory(path)) return std::nullopt;
    return static_cast<uint32_t>(std::filesystem::status(path).permissions());
  }
  std::vector<std::string> allFiles() const {
    std::vector<std::string> paths;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(root())) {
      if (!entry.is_directory()) paths.push_back(entry.path().string());
    }
    return paths;
  }
  void addLink(const std::string& path) const {
    std::filesystem::create_directory_symlink(root_.state(), path);
  }
  std::vector<std::string> filesBehindLinks() const {
    std::vector<std::string> paths;
    for (const auto& entry : std::filesystem::directory_iterator(root_.state())) {
      paths.push_back(entry.path().string());
    }
    return paths;
  }

 private:
  QVTemporaryRoot root_;
  QVPosixFileSystem files_{root_.logs().string()};
  // Takes nearly everything: permissions that are exact are so in spite of it.
  const mode_t umask_;
};

template <class Harness>
class QVFileSystemContract : public testing::Test {
 protected:
  std::string path(const std::string& below) const { return harness_.root() + "/" + below; }
  std::optional<std::string> createDirectory(const std::string& below, uint32_t permissions) {
    const auto error = harness_.files().createDirectory(path(below), permissions);
    return error ? std::optional(error->description()) : std::nullopt;
  }
  // What went wrong; nothing where nothing did.
  std::optional<std::string> write(const std::string& below, std::string_view text) {
    const auto file = harness_.files().makeAtomicFile(path(below));
    file->write(text);
    const auto error = file->commit();
    return error ? std::optional(error->description()) : std::nullopt;
  }
  std::optional<std::string> contents(const std::string& below) {
    return harness_.contents(path(below));
  }

  Harness harness_;
};

using Harnesses = testing::Types<FakeFileSystemHarness, PosixFileSystemHarness>;
TYPED_TEST_SUITE(QVFileSystemContract, Harnesses);

TYPED_TEST(QVFileSystemContract, MakesADirectoryWithThoseAboveItThatAreMissing) {
  EXPECT_EQ(this->createDirectory("a/b/c", 0777), std::nullopt);
  for (const char* below : {"a/b/c", "a/b", "a"}) {
    EXPECT_EQ(this->harness_.permissions(this->path(below)), 0777u) << below;
  }
  EXPECT_EQ(this->harness_.permissions(this->harness_.root()), 0777u);
}

TYPED_TEST(QVFileSystemContract, MakesNothingBehindALink) {
  EXPECT_EQ(this->createDirectory("a", 0777), std::nullopt);
  this->harness_.addLink(this->path("a/link"));
  EXPECT_EQ(this->createDirectory("a/link", 0777),
            this->path("a/link: Too many levels of symbolic links"));
  EXPECT_EQ(this->createDirectory("a/link/b", 0777),
            this->path("a/link: Too many levels of symbolic links"));
  EXPECT_THAT(this->harness_.filesBehindLinks(), IsEmpty());
}

TYPED_TEST(QVFileSystemContract, WritesNoFileBehindALink) {
  EXPECT_EQ(this->createDirectory("a", 0777), std::nullopt);
  this->harness_.addLink(this->path("a/link"));
  EXPECT_EQ(this->write("a/link/file", "x"),
            this->path("a/link/file: Too many levels of symbolic links"));
  EXPECT_THAT(this->harness_.filesBehindLinks(), IsEmpty());
  EXPECT_EQ(this->write("a/link", "x"), std::nullopt) << "a file takes its place";
  EXPECT_EQ(this->contents("a/link"), "x");
  EXPECT_THAT(this->harness_.filesBehindLinks(), IsEmpty());
}

TYPED_TEST(QVFileSystemContract, LeavesDirectoriesThatAreThereAlone) {
  EXPECT_EQ(this->createDirectory("a", 0700), std::nullopt);
  EXPECT_EQ(this->createDirectory("a/b", 0777), std::nullopt);
  EXPECT_EQ(this->createDirectory("a/b", 0711), std::nullopt);
  EXPECT_EQ(this->harness_.permissions(this->path("a")), 0700u);
  EXPECT_EQ(this->harness_.permissions(this->path("a/b")), 0777u);
}

TYPED_TEST(QVFileSystemContract, NamesTheFileThatShouldBeADirectory) {
  this->harness_.makeRoot();
  ASSERT_EQ(this->write("file", "x"), std::nullopt);
  EXPECT_EQ(this->createDirectory("file", 0777), this->path("file: Not a directory"));
  EXPECT_EQ(this->createDirectory("file/b", 0777), this->path("file: Not a directory"));
  EXPECT_EQ(this->contents("file"), "x");
}

TYPED_TEST(QVFileSystemContract, RefusesADirectoryWhoseNameIsTooLong) {
  this->harness_.makeRoot();
  EXPECT_THAT(this->createDirectory("a/" + std::string(256, 'n'), 0777).value_or(""),
              EndsWith("n: File name too long"));
  EXPECT_EQ(this->harness_.permissions(this->path("a")), 0777u) << "those above it stay";
}

TYPED_TEST(QVFileSystemContract, WritesAFileThatAppearsWhenItIsWhole) {
  this->harness_.makeRoot();
  const auto file = this->harness_.files().makeAtomicFile(this->path("file"));
  file->write("first ");
  EXPECT_EQ(this->contents("file"), std::nullopt);
  file->write("");
  file->write("second");
  EXPECT_EQ(this->contents("file"), std::nullopt);
  EXPECT_EQ(file->commit(), std::nullopt);
  EXPECT_EQ(this->contents("file"), "first second");
  EXPECT_THAT(this->harness_.allFiles(), ElementsAre(this->path("file")));
}

TYPED_TEST(QVFileSystemContract, KeepsTheOldContentsUntilTheNewOnesAreWhole) {
  this->harness_.makeRoot();
  ASSERT_EQ(this->write("file", "old"), std::nullopt);
  const auto file = this->harness_.files().makeAtomicFile(this->path("file"));
  file->write("new");
  EXPECT_EQ(this->contents("file"), "old");
  EXPECT_EQ(file->commit(), std::nullopt);
  EXPECT_EQ(this->contents("file"), "new");
}

TYPED_TEST(QVFileSystemContract, LeavesNothingOfAFileThatIsDropped) {
  this->harness_.makeRoot();
  {
    const auto file = this->harness_.files().makeAtomicFile(this->path("file"));
    file->write(std::string(1'000'000, 'x'));
  }
  EXPECT_THAT(this->harness_.allFiles(), IsEmpty());
}

TYPED_TEST(QVFileSystemContract, WritesFilesOfAllSizesInPiecesOfAllSizes) {
  this->harness_.makeRoot();
  for (const std::size_t piece : {std::size_t{1}, std::size_t{1000}, std::size_t{65535},
                                  std::size_t{65536}, std::size_t{65537}, std::size_t{200'000}}) {
    std::string expected;
    const auto file = this->harness_.files().makeAtomicFile(this->path("file"));
    for (std::size_t i = 0; i < 10; ++i) {
      const std::string text(piece, static_cast<char>('0' + i));
      file->write(text);
      expected += text;
    }
    EXPECT_EQ(file->commit(), std::nullopt);
    EXPECT_TRUE(this->contents("file") == expected) << piece;
  }
  EXPECT_EQ(this->write("empty", ""), std::nullopt);
  EXPECT_EQ(this->contents("empty"), "");
}

TYPED_TEST(QVFileSystemContract, LetsTheLaterOfTwoFilesOfOneNameWin) {
  this->harness_.makeRoot();
  const auto first = this->harness_.files().makeAtomicFile(this->path("file"));
  const auto second = this->harness_.files().makeAtomicFile(this->path("file"));
  first->write("first");
  second->write("second");
  EXPECT_EQ(second->commit(), std::nullopt);
  EXPECT_EQ(this->contents("file"), "second");
  EXPECT_EQ(first->commit(), std::nullopt);
  EXPECT_EQ(this->contents("file"), "first");
}

TYPED_TEST(QVFileSystemContract, AnswersAtTheEndThatAFileCannotBeOpened) {
  EXPECT_EQ(this->write("missing/file", "x"),
            this->path("missing/file: No such file or directory"));
  this->harness_.makeRoot();
  ASSERT_EQ(this->write("file", "x"), std::nullopt);
  EXPECT_EQ(this->write("file/below", "y"), this->path("file/below: Not a directory"));
  EXPECT_EQ(this->contents("file"), "x");
}

TYPED_TEST(QVFileSystemContract, LeavesNothingOfAFileThatCannotTakeItsPlace) {
  EXPECT_EQ(this->createDirectory("a", 0777), std::nullopt);
  EXPECT_EQ(this->write("a", "x"), this->path("a: Is a directory"));
  const std::string longest(255, 'n');
  EXPECT_EQ(this->write(longest + "n", "x"), this->path(longest + "n: File name too long"));
  EXPECT_THAT(this->harness_.allFiles(), IsEmpty());
  EXPECT_EQ(this->write(longest, "x"), std::nullopt);
  EXPECT_EQ(this->contents(longest), "x");
}

}  // namespace
