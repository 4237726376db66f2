#include "tests/support/QVTemporaryRoot.h"
#include "tools/qvctl/QVWhoMay.h"

#include <filesystem>
#include <fstream>

#include <grp.h>
#include <gtest/gtest.h>
#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

class QVWhoMayTest : public testing::Test {
 protected:
  QVWhoMayTest() { std::ofstream(file_) << "text"; }

  std::string of(mode_t mode, int wanted) const {
    EXPECT_EQ(::chmod(file_.c_str(), mode), 0);
    return QVWhoMay(file_, wanted);
  }

  const QVTemporaryRoot root_;
  const std::filesystem::path file_ = root_.path() / "file";
  // NOLINTBEGIN(concurrency-mt-unsafe)
  const std::string group_ =
      std::string("; members of the group ") + ::getgrgid(::getegid())->gr_name + " may";
  const std::string user_ = std::string("; the user ") + ::getpwuid(::geteuid())->pw_name + " may";
  // NOLINTEND(concurrency-mt-unsafe)
};

TEST_F(QVWhoMayTest, NamesTheGroupThatHasWhatIsWanted) {
  EXPECT_EQ(of(0660, W_OK), group_);
  EXPECT_EQ(of(0640, R_OK), group_);
  EXPECT_EQ(of(0070, W_OK | X_OK), group_);
}

TEST_F(QVWhoMayTest, ElseNamesTheOwner) {
  EXPECT_EQ(of(0640, W_OK), user_);
  EXPECT_EQ(of(0750, W_OK | X_OK), user_);
}

TEST_F(QVWhoMayTest, NamesNobodyWhereThereIsNobody) {
  EXPECT_EQ(of(0000, R_OK), "");
  EXPECT_EQ(of(0604, W_OK | X_OK), "");
  EXPECT_EQ(QVWhoMay(root_.path() / "missing", R_OK), "");
}

}  // namespace
