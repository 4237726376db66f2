// qvctl --root: another system's directories, whose links are that system's own.

#include "tests/e2e/qvctl/QVToolTest.h"

#include <filesystem>
#include <fstream>

#include <gmock/gmock.h>

namespace {

using ::testing::AllOf;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

const std::vector<std::vector<std::string>> kCommands{
    {"status"}, {"sessions"},        {"events"},          {"watch", "--for", "0"}, {"send", "a=1"},
    {"kill"},   {"summary", "list"}, {"reporting", "on"}, {"reporting", "show"},   {"channels"}};

class QVToolRootTest : public QVToolTest {
 protected:
  QVToolRootTest() {
    std::filesystem::create_directories(image_);
    std::filesystem::create_directories(outside_);
  }
  Output below(const std::filesystem::path& root, Arguments arguments) const {
    arguments.insert(arguments.end(), {"--root", root});
    return qvctl(arguments);
  }
  // What is `place` in the image is a link that leads out of it.
  std::filesystem::path lead(const char* place) const {
    const auto link = image_ / place;
    std::filesystem::create_directories(link.parent_path());
    std::filesystem::create_symlink(outside_, link);
    return link;
  }
  static std::vector<std::string> entries(const std::filesystem::path& directory) {
    std::vector<std::string> names;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(directory)) {
      names.push_back(entry.path().lexically_relative(directory));
    }
    return names;
  }

  const std::filesystem::path image_ = root_.path() / "image";
  const std::filesystem::path outside_ = root_.path() / "outside";
};

TEST_F(QVToolRootTest, SwitchesReportingThere) {
  std::filesystem::create_directories(image_ / "run/quietvox/notify");
  const Output output = below(image_, {"reporting", "off", "--json"});
  EXPECT_EQ(output.status, 0) << output.error;
  EXPECT_THAT(output.out, HasSubstr("\"posted\":true"));
  EXPECT_TRUE(std::filesystem::is_regular_file(
      image_ / "etc/quietvox/preferences/net.quillon.quietvox.json"));
  EXPECT_TRUE(std::filesystem::is_regular_file(
      image_ / "run/quietvox/notify/net.quillon.quietvox.reporting"));
  EXPECT_THAT(below(image_, {"reporting", "show"}).out, HasSubstr("preference  off"));
}

TEST_F(QVToolRootTest, FollowsNoDirectoryThatIsALink) {
  std::filesystem::create_directories(outside_ / "notify");
  std::filesystem::create_directories(outside_ / "quietvox/notify");
  const auto before = entries(outside_);
  for (const char* place :
       {"etc", "etc/quietvox", "etc/quietvox/preferences", "run", "run/quietvox",
        "run/quietvox/notify", "run/quietvox/channels", "run/quietvox/reporting.socket",
        "var/lib/quietvox", "var/lib/quietvox/reporting.db", "var/lib/quietvox/reporting.db-wal",
        "var/log/quietvox/DiagnosticLogs", "etc/quietvox/channels.json"}) {
    std::filesystem::remove_all(image_);
    const auto link = lead(place);
    for (const auto& arguments : kCommands) {
      const Output output = below(image_, arguments);
      EXPECT_EQ(output.status, 1) << testing::PrintToString(arguments) << output.error;
      EXPECT_THAT(output.error, AllOf(HasSubstr(link.string() + ": "), HasSubstr("link")));
    }
  }
  EXPECT_EQ(entries(outside_), before);
}

TEST_F(QVToolRootTest, TakesARootThatIsALinkItself) {
  const auto link = root_.path() / "link";
  std::filesystem::create_directory_symlink(image_, link);
  for (const std::string& root : {link.string(), link.string() + "/"}) {
    EXPECT_EQ(below(root, {"reporting", "off"}).status, 0);
    EXPECT_TRUE(std::filesystem::exists(image_ / "etc/quietvox/preferences"));
    std::filesystem::remove_all(image_ / "etc");
  }
}

TEST_F(QVToolRootTest, ListsNoSummaryThatIsALink) {
  const auto directory = image_ / "var/log/quietvox/DiagnosticLogs/Audio/Reporting";
  std::filesystem::create_directories(directory);
  std::ofstream(outside_ / "secret") << "[{}]";
  std::filesystem::create_symlink(
      outside_ / "secret", directory / "20261121-075814+0000-quietvox-net.example-telephony.json");
  EXPECT_EQ(below(image_, {"summary", "list", "--json"}).out, "[]\n");
  EXPECT_EQ(below(image_, {"summary", "show"}).status, 1);
}

TEST_F(QVToolRootTest, RefusesARootThatIsNoDirectory) {
  std::ofstream(root_.path() / "file") << "no directory";
  for (const char* name : {"nowhere", "file"}) {
    const auto root = root_.path() / name;
    for (const auto& arguments : kCommands) {
      const Output output = below(root, arguments);
      EXPECT_EQ(output.status, 1) << testing::PrintToString(arguments) << output.error;
      EXPECT_THAT(output.error, HasSubstr(root.string() + ": N"));
      EXPECT_THAT(output.out, IsEmpty());
    }
  }
  EXPECT_FALSE(std::filesystem::exists(root_.path() / "nowhere"));
}

}  // namespace
