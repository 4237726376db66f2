#include "platform/fake/QVFakeProcess.h"
#include "platform/linux/system/QVLinuxProcess.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>

#include <gmock/gmock.h>

namespace {

class FakeProcessHarness {
 public:
  QVProcess& process() { return process_; }
  void addProcess(int32_t processIdentifier, const std::string& name) {
    process_.addProcess(processIdentifier, name);
  }

 private:
  QVFakeProcess process_;
};

// A process table of files in a temporary directory.
class LinuxProcessHarness {
 public:
  LinuxProcessHarness() { addProcess(process_.ownProcessIdentifier(), "quietvoxd"); }
  ~LinuxProcessHarness() { std::filesystem::remove_all(table_); }
  LinuxProcessHarness(const LinuxProcessHarness&) = delete;
  LinuxProcessHarness& operator=(const LinuxProcessHarness&) = delete;

  QVProcess& process() { return process_; }
  void addProcess(int32_t processIdentifier, const std::string& name) {
    const auto folder = std::filesystem::path(table_) / std::to_string(processIdentifier);
    std::filesystem::create_directories(folder);
    std::ofstream(folder / "comm") << name << '\n';
  }

 private:
  static std::string makeFolder() {
    std::string name = std::filesystem::temp_directory_path() / "qv-process-XXXXXX";
    if (mkdtemp(name.data()) == nullptr) ADD_FAILURE() << "no temporary directory";
    return name;
  }

  const std::string table_ = makeFolder();
  QVLinuxProcess process_{table_};
};

template <class Harness>
class QVProcessContract : public testing::Test {
 protected:
  Harness harness_;
};

using Harnesses = testing::Types<FakeProcessHarness, LinuxProcessHarness>;
TYPED_TEST_SUITE(QVProcessContract, Harnesses);

TYPED_TEST(QVProcessContract, KnowsItself) {
  QVProcess& process = this->harness_.process();
  EXPECT_GT(process.ownProcessIdentifier(), 0);
  EXPECT_EQ(process.ownProcessName(), "quietvoxd");
  EXPECT_EQ(process.nameOfProcess(process.ownProcessIdentifier()), "quietvoxd");
}

TYPED_TEST(QVProcessContract, NamesAnotherProcess) {
  this->harness_.addProcess(4711, "player one");
  EXPECT_EQ(this->harness_.process().nameOfProcess(4711), "player one");
}

TYPED_TEST(QVProcessContract, TellsNothingOfProcessesThatAreNot) {
  for (const int32_t processIdentifier : {4712, 0, -1}) {
    EXPECT_EQ(this->harness_.process().nameOfProcess(processIdentifier), std::nullopt);
  }
}

}  // namespace
