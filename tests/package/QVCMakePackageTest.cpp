// Which releases the installed CMake package says that it stands in for.

#include "tests/package/QVInstallation.h"

#include <fstream>
#include <sstream>

#include <gmock/gmock.h>

namespace {

class QVCMakePackageTest : public ::testing::Test {
 protected:
  QVCMakePackageTest() {
    std::filesystem::create_directories(project());
    std::ofstream(project() / "CMakeLists.txt")
        << "cmake_minimum_required(VERSION 3.25)\n"
           "project(finder LANGUAGES NONE)\n"
           "find_package(QuietVoxClient ${WANTED} CONFIG)\n"
           "message(STATUS \"found: ${QuietVoxClient_FOUND}\")\n";
    std::istringstream version(QV_VERSION);
    char dot = 0;
    version >> major_ >> dot >> minor_ >> dot >> patch_;
  }

  // Whether a project that wants this release takes the installed one.
  bool isFound(const std::string& wanted) const {
    const auto output = QVSubprocess::run(
        {"cmake", "-G", "Ninja", "-S", project().string(), "-B", (project() / "build").string(),
         "-DWANTED=" + wanted, "-DCMAKE_PREFIX_PATH=" + installation_.prefix().string()});
    EXPECT_EQ(output.status, 0) << output.text;
    const bool found = output.text.find("found: 1\n") != std::string::npos;
    EXPECT_NE(found, output.text.find("found: 0\n") != std::string::npos) << output.text;
    return found;
  }

  static std::string release(unsigned major, unsigned minor) {
    return std::to_string(major) + "." + std::to_string(minor);
  }

  std::filesystem::path project() const { return installation_.work() / "finder"; }

  const QVInstallation installation_{{"client", "client-dev"}};
  unsigned major_ = 0;
  unsigned minor_ = 0;
  unsigned patch_ = 0;
};

TEST_F(QVCMakePackageTest, IsTheReleasesOfItsMinorNumber) {
  EXPECT_TRUE(isFound(""));
  EXPECT_TRUE(isFound(release(major_, minor_)));
  EXPECT_TRUE(isFound(QV_VERSION));
  EXPECT_FALSE(isFound(release(major_, minor_).append(".").append(std::to_string(patch_ + 1))));
}

// Their C++ sources may not compile with this one.
TEST_F(QVCMakePackageTest, IsNoOtherRelease) {
  EXPECT_FALSE(isFound(release(major_, minor_ + 1)));
  EXPECT_FALSE(isFound(release(major_ + 1, minor_)));
  if (minor_ > 0) {
    EXPECT_FALSE(isFound(release(major_, minor_ - 1)));
  }
}

}  // namespace
