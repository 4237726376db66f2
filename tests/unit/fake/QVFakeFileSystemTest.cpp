#include "platform/fake/QVFakeFileSystem.h"
#include "platform/fake/QVFakeJSONOutput.h"

#include <memory>
#include <optional>
#include <string>

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using Step = QVFakeFileSystem::Step;

class QVFakeFileSystemTest : public testing::Test {
 protected:
  QVFakeFileSystemTest() { EXPECT_EQ(files_.createDirectory("/logs", 0755), std::nullopt); }

  std::string write(const std::string& path, std::string_view text) {
    const auto file = files_.makeAtomicFile(path);
    file->write(text);
    const auto error = file->commit();
    return error ? error->description() : "";
  }

  QVFakeFileSystem files_;
};

TEST_F(QVFakeFileSystemTest, FailsAtTheStepThatItIsToldTo) {
  files_.fail(Step::open, std::errc::permission_denied);
  EXPECT_EQ(write("/logs/file", "x"), "/logs/file: Permission denied");
  files_.recover(Step::open);
  files_.fail(Step::rename, std::errc::read_only_file_system);
  EXPECT_EQ(write("/logs/file", "x"), "/logs/file: Read-only file system");
  files_.recover(Step::rename);
  EXPECT_EQ(write("/logs/file", "x"), "");
  EXPECT_THAT(files_.files(), ElementsAre("/logs/file"));
}

TEST_F(QVFakeFileSystemTest, RunsFullAfterSoManyBytes) {
  files_.fail(Step::write, std::errc::no_space_on_device, 3);
  EXPECT_EQ(write("/logs/file", "123"), "");
  EXPECT_EQ(write("/logs/file", "1234"), "/logs/file: No space left on device");
  EXPECT_EQ(files_.contents("/logs/file"), "123");
}

TEST_F(QVFakeFileSystemTest, FailsWithDirectoriesThatAreNotThereYet) {
  files_.fail(Step::createDirectory, std::errc::read_only_file_system);
  EXPECT_EQ(files_.createDirectory("/logs", 0777), std::nullopt);
  const auto error = files_.createDirectory("/logs/a/b", 0777);
  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->description(), "/logs/a: Read-only file system");
  EXPECT_EQ(files_.permissions("/logs/a"), std::nullopt);
}

TEST_F(QVFakeFileSystemTest, CountsTheFilesThatAreBeingWritten) {
  auto first = files_.makeAtomicFile("/logs/first");
  const auto second = files_.makeAtomicFile("/logs/second");
  EXPECT_EQ(files_.openFiles(), 2u);
  EXPECT_EQ(second->commit(), std::nullopt);
  EXPECT_EQ(files_.openFiles(), 1u);
  first.reset();
  EXPECT_EQ(files_.openFiles(), 0u);
  EXPECT_THAT(files_.files(), ElementsAre("/logs/second"));
}

TEST_F(QVFakeFileSystemTest, TakesFilesThatATestPutsThere) {
  files_.addFile("/logs/file", "text");
  EXPECT_EQ(files_.contents("/logs/file"), "text");
  files_.addFile("/logs/file", "other");
  EXPECT_EQ(files_.contents("/logs/file"), "other");
  EXPECT_EQ(files_.contents("/logs"), std::nullopt) << "a directory";
  EXPECT_EQ(files_.permissions("/logs/file"), std::nullopt) << "a file";
}

TEST_F(QVFakeFileSystemTest, TakesLinksThatATestPutsThere) {
  files_.addLink("/logs/link");
  EXPECT_EQ(write("/logs/link/file", "x"), "/logs/link/file: Too many levels of symbolic links");
  EXPECT_EQ(files_.contents("/logs/link"), std::nullopt);
  EXPECT_EQ(files_.permissions("/logs/link"), std::nullopt);
  EXPECT_THAT(files_.files(), IsEmpty());
}

TEST_F(QVFakeFileSystemTest, LetsAFileOutliveIt) {
  std::unique_ptr<QVAtomicFile> file;
  {
    QVFakeFileSystem files;
    file = files.makeAtomicFile("/file");
  }
  file->write("x");
  EXPECT_EQ(file->commit(), std::nullopt);
}

TEST_F(QVFakeFileSystemTest, NotesWrongUse) {
  const auto file = files_.makeAtomicFile("/logs/file");
  EXPECT_EQ(file->commit(), std::nullopt);
  file->write("x");
  EXPECT_EQ(file->commit(), std::nullopt);
  static_cast<void>(files_.makeAtomicFile("relative"));
  static_cast<void>(files_.createDirectory("/logs//a", 0777));
  files_.addFile("/nowhere/file", "x");
  EXPECT_THAT(files_.takeMisuses(),
              ElementsAre("written after its end: /logs/file", "committed twice: /logs/file",
                          "no place for a file: relative", "no place for a directory: /logs//a",
                          "no place for a file: /nowhere/file"));
}

TEST(QVFakeJSONOutputTest, NotesWrongUse) {
  QVFakeJSONOutput output;
  const auto stream = output.makeArrayStream([](std::string_view) {});
  const QVDictionaryEntry unordered[] = {{"b", 1}, {"a", 2}};
  const QVDictionaryEntry twice[] = {{"a", 1}, {"a", 2}};
  EXPECT_EQ(stream->append(unordered), std::nullopt);
  EXPECT_EQ(stream->append("name", twice), std::nullopt);
  EXPECT_THAT(output.takeMisuses(), ElementsAre("members out of order", "members out of order"));
  stream->end();
  EXPECT_THAT(output.takeMisuses(), IsEmpty());
  EXPECT_EQ(stream->append(QVDictionary{{"a", 1}}), std::nullopt);
  stream->end();
  EXPECT_THAT(output.takeMisuses(),
              ElementsAre("an array appended to after its end", "an array ended twice"));
}

}  // namespace
