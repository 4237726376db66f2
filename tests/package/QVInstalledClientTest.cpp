// The installed client library: programs are built with it and report to the service.

#include "tests/package/QVInstallation.h"
#include "tests/support/QVEndToEndTest.h"

#include <gmock/gmock.h>

namespace {

using ::testing::ElementsAre;
using ::testing::SizeIs;

constexpr const char* kPrograms = QV_SOURCE_DIRECTORY "/packaging/smoke";

// A compiler on a busy machine.
constexpr std::chrono::minutes kBuildLimit{5};

using Language = QVInstallation::Language;

void add(std::vector<std::string>& command, const std::vector<std::string>& arguments) {
  command.insert(command.end(), arguments.begin(), arguments.end());
}

void run(const std::vector<std::string>& command) {
  const auto output = QVSubprocess::run(command, kBuildLimit);
  ASSERT_EQ(output.status, 0) << output.text;
}

class QVInstalledClientTest : public QVEndToEndTest {
 protected:
  // Has a program report to a service; its session is in the store then.
  void expectReports(const std::filesystem::path& program, const std::string& language) {
    service();
    run({"env", "QUIETVOX_SOCKET=" + root_.socket().string(),
         "LD_LIBRARY_PATH=" + installation_.libraries().string(), program.string()});
    endService();
    EXPECT_THAT(store().rows("SELECT session_id, json_extract(payload, '$.language') "
                             "FROM beacon_message WHERE category = 3 AND type = 1"),
                ElementsAre("4711|" + language));
    EXPECT_THAT(store().rows("SELECT * FROM beacon_session WHERE session_id = 4711"), SizeIs(1));
  }

  void buildWithPkgConfig(Language language, const std::string& source,
                          const std::filesystem::path& program) {
    auto command = QVInstallation::compiler(language);
    add(command, {std::string(kPrograms).append("/").append(source), "-o", program.string()});
    add(command, installation_.pkgConfig({"--cflags", "--libs"}));
    run(command);
  }

  // The directory with what was built.
  std::filesystem::path buildWithCMake(const std::vector<std::string>& options) {
    const auto build = installation_.work() / "build";
    std::vector<std::string> command{"cmake",
                                     "-G",
                                     "Ninja",
                                     "-S",
                                     kPrograms,
                                     "-B",
                                     build.string(),
                                     "-DCMAKE_C_COMPILER=" QV_C_COMPILER,
                                     "-DCMAKE_CXX_COMPILER=" QV_CXX_COMPILER,
                                     "-DCMAKE_PREFIX_PATH=" + installation_.prefix().string()};
    add(command, options);
    if (*QV_SANITIZE != '\0') {
      add(command,
          {"-DCMAKE_C_FLAGS=-fsanitize=" QV_SANITIZE, "-DCMAKE_CXX_FLAGS=-fsanitize=" QV_SANITIZE});
    }
    run(command);
    run({"cmake", "--build", build.string()});
    return build;
  }

  const QVInstallation installation_{{"client", "client-dev"}};
};

TEST_F(QVInstalledClientTest, BuildsCxxProgramsWithPkgConfig) {
  const auto program = installation_.work() / "reporter";
  buildWithPkgConfig(Language::cxx, "reporter.cpp", program);
  expectReports(program, "C++");
}

TEST_F(QVInstalledClientTest, BuildsCProgramsWithPkgConfig) {
  const auto program = installation_.work() / "reporter";
  buildWithPkgConfig(Language::c, "reporter.c", program);
  expectReports(program, "C");
}

TEST_F(QVInstalledClientTest, BuildsCxxProgramsWithItsCMakePackage) {
  expectReports(buildWithCMake({"-DWITH_CXX=ON"}) / "reporter-cxx", "C++");
}

TEST_F(QVInstalledClientTest, BuildsCProgramsWithItsCMakePackage) {
  expectReports(buildWithCMake({"-DWITH_CXX=OFF"}) / "reporter-c", "C");
}

}  // namespace
