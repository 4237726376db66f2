// The installed headers of the client library, as a compiler sees them.

#include "tests/package/QVInstallation.h"

#include <fstream>

#include <gmock/gmock.h>

namespace {

using ::testing::HasSubstr;
using Language = QVInstallation::Language;

class QVInstalledHeadersTest : public ::testing::Test {
 protected:
  // What a compiler says of a program that has these lines before an empty main().
  QVSubprocess::Output compile(Language language, const std::string& lines,
                               const std::vector<std::string>& options = {}) const {
    const std::string source =
        (installation_.work() / (language == Language::c ? "program.c" : "program.cpp")).string();
    std::ofstream(source) << lines << "int main(void) { return 0; }\n";
    auto command = QVInstallation::compiler(language);
    command.insert(command.end(), options.begin(), options.end());
    command.insert(command.end(),
                   {"-fsyntax-only", "-I" + (installation_.prefix() / "include").string(), source});
    return QVSubprocess::run(command);
  }

  void expectCompiles(Language language, const std::string& lines,
                      const std::vector<std::string>& options = {}) const {
    const auto output = compile(language, lines, options);
    EXPECT_EQ(output.status, 0) << lines << output.text;
  }

  void expectRefused(Language language, const std::string& lines, const char* why,
                     const std::vector<std::string>& options = {}) const {
    const auto output = compile(language, lines, options);
    EXPECT_NE(output.status, 0) << lines;
    EXPECT_THAT(output.text, HasSubstr(why)) << lines;
  }

  const QVInstallation installation_{{"client-dev"}};
};

constexpr const char* kChannels = "#include <quietvox/quietvox_channels.h>\n";

TEST_F(QVInstalledHeadersTest, CompileByThemselves) {
  int count = 0;
  for (const auto& entry : std::filesystem::directory_iterator(installation_.headers())) {
    const std::string name = entry.path().filename().string();
    const std::string include = std::string("#include <quietvox/").append(name).append(">\n");
    // Parts of quietvox_channels.h lie in headers of their own, which rely on what it asks for.
    const std::vector<std::string> options{"-D_DEFAULT_SOURCE"};
    expectCompiles(Language::cxx, include, options);
    // Those that are named in small letters are for C, too.
    if (!name.starts_with("QV") || name == "QVClientExport.h")
      expectCompiles(Language::c, include, options);
    ++count;
  }
  EXPECT_GT(count, 10);
}

TEST_F(QVInstalledHeadersTest, AskForPosixWhereTheChannelsComeFirst) {
  expectCompiles(Language::c, kChannels);
  expectCompiles(Language::c, std::string(kChannels).append("#include <quietvox/quietvox.h>\n"));
}

// Else the compiler complains of a type deep inside.
TEST_F(QVInstalledHeadersTest, SayWhatToDoWhereTheChannelsComeTooLateForPosix) {
  for (const char* before : {"#include <stdio.h>\n", "#include <quietvox/quietvox.h>\n"}) {
    const std::string lines = std::string(before).append(kChannels);
    expectRefused(Language::c, lines, "include quietvox_channels.h before any other header");
    expectCompiles(Language::c, lines, {"-D_DEFAULT_SOURCE"});
    expectCompiles(Language::c, lines, {"-std=gnu99"});
    expectCompiles(Language::cxx, lines);
  }
}

TEST_F(QVInstalledHeadersTest, RefuseChannelsWhereCountingTakesALock) {
  // As compilers for such a processor have it; with 0 there are no such atomics.
  for (const char* kind : {"0", "1"}) {
    const std::vector<std::string> options{
        "-U__GCC_ATOMIC_LLONG_LOCK_FREE",
        std::string("-D__GCC_ATOMIC_LLONG_LOCK_FREE=").append(kind)};
    for (const Language language : {Language::c, Language::cxx})
      expectRefused(language, kChannels, "needs 64-bit atomics without a lock", options);
  }
}

}  // namespace
