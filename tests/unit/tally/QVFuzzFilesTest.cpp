#include "fuzz/QVFuzzFileSeeds.h"

#include <functional>
#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace {

struct Target {
  std::string name;
  std::function<QVFuzzFileProgress(std::string_view)> run;
  std::vector<QVFuzzFileSeed> seeds;
  std::size_t brokenDiffer;  // at least so many broken seeds get less or more far than whole ones
};

class QVFuzzFilesTest : public testing::TestWithParam<Target> {};

std::string show(const QVFuzzFileProgress& progress) {
  return std::to_string(progress.accepted) + " accepted, " + std::to_string(progress.items) +
         " items";
}

TEST_P(QVFuzzFilesTest, GetsAsFarAsTheSeedsPromise) {
  for (const auto& seed : GetParam().seeds) {
    EXPECT_EQ(show(GetParam().run(seed.bytes)), show(seed.progress)) << seed.name;
  }
}

// The promises that the target holds its reader to hold for bytes near the right ones.
TEST_P(QVFuzzFilesTest, KeepsItsPromisesForSeedsThatAreBroken) {
  std::size_t differing = 0;
  for (const auto& seed : GetParam().seeds) {
    for (std::size_t length = 0; length < seed.bytes.size(); ++length) {
      GetParam().run(seed.bytes.substr(0, length));
    }
    std::mt19937 random(1);
    for (int round = 0; round < 4; ++round) {
      for (std::size_t at = 0; at < seed.bytes.size(); ++at) {
        std::string bytes = seed.bytes;
        bytes[at] = static_cast<char>(random());
        differing += GetParam().run(bytes) == seed.progress ? 0U : 1U;
      }
    }
  }
  EXPECT_GT(differing, GetParam().brokenDiffer);
}

INSTANTIATE_TEST_SUITE_P(
    , QVFuzzFilesTest,
    testing::Values(Target{"MMV", QVFuzzMMV, QVFuzzMMVSeeds(), 1000},
                    Target{"KernelText", QVFuzzKernelText, QVFuzzKernelTextSeeds(), 100},
                    Target{"JSONFile", QVFuzzJSONFile, QVFuzzJSONFileSeeds(), 1000},
                    Target{"JSONScan", QVFuzzJSONScan, QVFuzzJSONScanSeeds(), 1000}),
    [](const auto& instance) { return instance.param.name; });

}  // namespace
