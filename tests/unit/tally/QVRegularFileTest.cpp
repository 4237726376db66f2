// How files of others are read: what it costs, and that nothing of them is missed.

#include "platform/linux/files/QVRegularFile.h"
#include "tests/support/QVTemporaryRoot.h"

#include <cstdint>
#include <filesystem>
#include <fstream>
#include <string>

#include <gmock/gmock.h>

namespace {

// The calls by which this thread has read anything so far, those of this question included.
std::uint64_t readCalls() {
  std::ifstream counters("/proc/thread-self/io");
  std::string name;
  std::uint64_t count = 0;
  while (counters >> name >> count) {
    if (name == "syscr:") return count;
  }
  ADD_FAILURE() << "the kernel does not count reads";
  return 0;
}

class QVRegularFileTest : public testing::Test {
 protected:
  std::string path() const { return (root_.path() / "file").string(); }
  void write(const std::string& text) const { std::ofstream(path()) << text; }
  // The calls that reading the file takes; what it holds is in contents_ then.
  std::uint64_t callsToRead(const std::string& path, std::size_t maximumBytes) {
    const QVRegularFile file(path, QVRegularFile::Links::refuse);
    EXPECT_EQ(file.error(), 0);
    static_cast<void>(readCalls());
    const std::uint64_t first = readCalls();
    const std::uint64_t second = readCalls();
    EXPECT_EQ(file.read(maximumBytes, contents_), 0);
    return readCalls() - second - (second - first);
  }

  const QVTemporaryRoot root_;
  std::string contents_;
};

TEST_F(QVRegularFileTest, TakesOneCallForAFileThatSaysItsSize) {
  for (const std::size_t size : {1U, 100U, 16U * 1024, 100U * 1024}) {
    write(std::string(size, 'x'));
    EXPECT_EQ(callsToRead(path(), 1U << 20U), 1U) << size;
    EXPECT_EQ(contents_, std::string(size, 'x'));
    EXPECT_EQ(callsToRead(path(), size), 1U) << size;
    EXPECT_EQ(contents_, std::string(size, 'x'));
  }
}

TEST_F(QVRegularFileTest, ReadsAFilePartByPart) {
  write("abcdefgh");
  const QVRegularFile file(path(), QVRegularFile::Links::refuse);
  EXPECT_EQ(file.readPart(0, 3, contents_), 0);
  EXPECT_EQ(contents_, "abc");
  EXPECT_EQ(file.readPart(6, 3, contents_), 0);
  EXPECT_EQ(contents_, "gh");
  EXPECT_EQ(file.readPart(8, 3, contents_), 0);
  EXPECT_EQ(contents_, "");
}

TEST_F(QVRegularFileTest, ReadsAFileThatSaysNoSizeToItsEnd) {
  ASSERT_EQ(std::filesystem::file_size("/proc/self/status"), 0U);
  EXPECT_EQ(callsToRead("/proc/self/status", 1U << 20U), 2U);
  EXPECT_THAT(contents_, testing::StartsWith("Name:"));
  EXPECT_THAT(contents_, testing::EndsWith("\n"));
  write("");
  EXPECT_EQ(callsToRead(path(), 1U << 20U), 1U);
  EXPECT_EQ(contents_, "");
}

TEST_F(QVRegularFileTest, RefusesAFileThatIsTooLarge) {
  write(std::string(100, 'x'));
  const QVRegularFile file(path(), QVRegularFile::Links::refuse);
  EXPECT_EQ(file.read(99, contents_), QVRegularFile::kTooLarge);
  EXPECT_EQ(file.read(100, contents_), 0);
  EXPECT_EQ(file.readBeginning(10, contents_), 0);
  EXPECT_EQ(contents_, std::string(10, 'x'));
}

}  // namespace
