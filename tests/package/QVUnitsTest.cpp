// The units, as the service manager's own tools read them.

#include "tests/package/QVInstallation.h"

#include <fstream>
#include <map>
#include <sstream>

#include <gmock/gmock.h>

namespace {

using ::testing::_;
using ::testing::Contains;
using ::testing::Each;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Key;
using ::testing::Pair;

// What systemd-analyze may find of the service's exposure, in tenths; packaging/README.md has what
// it does find.
constexpr const char* kMostExposed = "10";

std::string textOf(const std::filesystem::path& file) {
  std::ostringstream text;
  text << std::ifstream(file).rdbuf();
  return text.str();
}

class QVUnitsTest : public ::testing::Test {
 protected:
  // The installed units of a manager ("system" or "user"), in a directory of their own and with the
  // program where it was built: it is not installed where the unit says.
  std::vector<std::string> unitsOf(const std::string& manager) const {
    const auto units = installation_.prefix() / "lib" / "systemd" / manager;
    for (const char* name : {"quietvox.service", "quietvox.socket"}) {
      std::string text = textOf(units / name);
      EXPECT_FALSE(text.empty()) << name;
      const std::string program = QV_LIBEXEC_DIRECTORY "/quietvoxd";
      for (std::size_t at = text.find(program); at != std::string::npos;
           at = text.find(program, at)) {
        text.replace(at, program.size(), QV_BUILD_DIRECTORY "/bin/quietvoxd");
        at += 1;
      }
      std::ofstream(units / name) << text;
    }
    return {(units / "quietvox.socket").string(), (units / "quietvox.service").string()};
  }

  const QVInstallation installation_{{"service"}};
};

TEST_F(QVUnitsTest, LeaveTheManagerNothingToComplainAbout) {
  const auto units = unitsOf("system");
  const auto verdict =
      QVSubprocess::run({"systemd-analyze", "verify", "--man=no", units[0], units[1]});
  EXPECT_EQ(verdict.status, 0);
  EXPECT_THAT(verdict.text, IsEmpty());
}

TEST_F(QVUnitsTest, LeaveAUsersManagerNothingToComplainAbout) {
  const auto units = unitsOf("user");
  const auto verdict =
      QVSubprocess::run({"env", "XDG_RUNTIME_DIR=" + installation_.work().string(),
                         "systemd-analyze", "verify", "--user", "--man=no", units[0], units[1]});
  EXPECT_EQ(verdict.status, 0);
  EXPECT_THAT(verdict.text, IsEmpty());
}

TEST_F(QVUnitsTest, ExposeLittle) {
  const auto verdict =
      QVSubprocess::run({"systemd-analyze", "security", "--no-pager", "--offline=true",
                         std::string("--threshold=").append(kMostExposed), unitsOf("system")[1]});
  EXPECT_EQ(verdict.status, 0) << verdict.text;
  EXPECT_THAT(verdict.text, HasSubstr("Overall exposure level for quietvox.service"));
}

TEST_F(QVUnitsTest, HaveAnAccountAndGroupsOfTheirOwn) {
  const auto root = installation_.work() / "root";
  std::filesystem::create_directories(root / "etc");
  const auto made = QVSubprocess::run(
      {"systemd-sysusers", "--root=" + root.string(),
       (installation_.prefix() / "lib" / "sysusers.d" / "quietvox.conf").string()});
  ASSERT_EQ(made.status, 0) << made.text;
  EXPECT_THAT(textOf(root / "etc" / "passwd"), HasSubstr("quietvox:"));
  for (const char* group : {"quietvox:", "quietvox-client:", "quietvox-publish:"}) {
    EXPECT_THAT(textOf(root / "etc" / "group"), HasSubstr(group));
  }
}

// The manager takes one line for a place, and says nothing of others that are equal to it.
TEST_F(QVUnitsTest, MakeEachPlaceOnce) {
  std::ifstream lines(installation_.prefix() / "lib" / "tmpfiles.d" / "quietvox.conf");
  std::map<std::string, int> places;
  for (std::string line; std::getline(lines, line);) {
    if (line.empty() || line[0] == '#') continue;
    std::istringstream words(line);
    std::string type;
    std::string place;
    words >> type >> place;
    ++places[place];
  }
  EXPECT_THAT(places, Contains(Key("/var/lib/quietvox")));
  EXPECT_THAT(places, Each(Pair(_, 1)));
}

}  // namespace
