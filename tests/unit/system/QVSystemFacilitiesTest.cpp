#include "platform/linux/system/QVLinuxProcess.h"
#include "platform/linux/system/QVSDTTracePoints.h"
#include "platform/linux/system/QVSystemClock.h"

#include <array>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>

#include <gmock/gmock.h>
#include <unistd.h>

namespace {

using testing::ContainsRegex;

TEST(QVSystemClockTest, TellsTheMachinesTime) {
  const QVDate before = std::chrono::system_clock::now();
  const QVDate told = QVSystemClock().currentDate();
  const QVDate after = std::chrono::system_clock::now();
  EXPECT_LE(before, told);
  EXPECT_LE(told, after);
}

// What the program's notes say of its probes, as the tool that reads them prints it.
std::string notesOfThisProgram() {
  const std::string command =
      "readelf --notes --wide " + std::filesystem::read_symlink("/proc/self/exe").string();
  FILE* const output = popen(command.c_str(), "r");  // NOLINT(cert-env33-c): no foreign words
  if (output == nullptr) return {};
  std::string text;
  std::array<char, 4096> bytes;
  std::size_t count = 0;
  while ((count = fread(bytes.data(), 1, bytes.size(), output)) > 0) {
    text.append(bytes.data(), count);
  }
  EXPECT_EQ(pclose(output), 0) << command;
  return text;
}

TEST(QVSDTTracePointsTest, ShowsItsProbeInTheProgramsNotes) {
  // Only a program that uses the probe has it.
  QVSDTTracePoints points;
  points.mark(0x21042814);
  const std::string notes = notesOfThisProgram();
  EXPECT_THAT(notes, ContainsRegex("Provider: quietvox\n[[:blank:]]*Name: trace\n"));
  EXPECT_THAT(notes, ContainsRegex("Arguments: 4@[^ ]+ 8@[^ ]+ 8@[^ ]+ 8@[^ ]+ 8@[^ ]+\n"))
      << "the code and four arguments";
}

class QVLinuxProcessTest : public testing::Test {
 protected:
  ~QVLinuxProcessTest() override { std::filesystem::remove_all(table_); }

  std::optional<std::string> nameOf(const std::string& comm) {
    const auto folder = std::filesystem::path(table_) / "42";
    std::filesystem::create_directories(folder);
    std::ofstream(folder / "comm") << comm;
    return QVLinuxProcess(table_).nameOfProcess(42);
  }
  static std::string makeFolder() {
    std::string name = std::filesystem::temp_directory_path() / "qv-process-XXXXXX";
    if (mkdtemp(name.data()) == nullptr) ADD_FAILURE() << "no temporary directory";
    return name;
  }

  const std::string table_ = makeFolder();
};

TEST_F(QVLinuxProcessTest, ReadsTheKernelsTable) {
  const QVLinuxProcess process;
  EXPECT_EQ(process.ownProcessIdentifier(), getpid());
  // The kernel keeps 15 bytes of a program's name.
  const std::string program = std::filesystem::read_symlink("/proc/self/exe").filename();
  EXPECT_EQ(process.ownProcessName(), program.substr(0, 15));
  EXPECT_EQ(process.nameOfProcess(getpid()), program.substr(0, 15));
}

TEST_F(QVLinuxProcessTest, TakesTheNameAsItIs) {
  EXPECT_EQ(nameOf("player\n"), "player");
  EXPECT_EQ(nameOf("two words\n"), "two words");
  EXPECT_EQ(nameOf("line\n\n"), "line\n") << "only the last newline is the file's";
  EXPECT_EQ(nameOf("\n"), "");
  EXPECT_EQ(nameOf(""), std::nullopt);
}

TEST_F(QVLinuxProcessTest, TakesNamesThatAreText) {
  EXPECT_EQ(nameOf("Ger\u00e4t\n"), "Ger\u00e4t");
  EXPECT_EQ(nameOf("fourteen bytes\xC3\n"), "fourteen bytes") << "cut by the kernel";
  EXPECT_EQ(nameOf("thirteen byte\xE2\x82\n"), "thirteen byte");
  EXPECT_EQ(nameOf("a\xFFz\n"), std::nullopt);
  EXPECT_EQ(nameOf("a\x80\n"), std::nullopt);
}

TEST_F(QVLinuxProcessTest, FallsBackOnTheProgramsNameForItself) {
  EXPECT_EQ(QVLinuxProcess(table_).ownProcessName(), program_invocation_short_name);
}

TEST(QVLinuxProcessDeathTest, EndsAtOnceWithTheStatus) {
  EXPECT_EXIT(QVLinuxProcess().exitImmediately(2), testing::ExitedWithCode(2), "");
}

}  // namespace
