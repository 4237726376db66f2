#include "fuzz/QVFuzzBusFrames.h"
#include "fuzz/QVFuzzBusSeeds.h"

#include <random>
#include <string>

#include <gtest/gtest.h>

namespace {

std::string show(const QVFuzzBusProgress& progress) {
  return std::to_string(progress.messages) + " messages, " + std::to_string(progress.bodies) +
         " bodies, " + std::to_string(progress.dictionaries) + " dictionaries, " +
         std::to_string(progress.calls) + " calls";
}

}  // namespace

TEST(QVFuzzBusFrames, GetsAsFarAsTheSeedsPromise) {
  for (const auto& seed : QVFuzzBusSeeds()) {
    EXPECT_EQ(show(QVFuzzBusFrames(seed.bytes)), show(seed.progress)) << seed.name;
  }
}

TEST(QVFuzzBusFrames, GetsAsFarHoweverTheStreamIsCut) {
  for (auto seed : QVFuzzBusSeeds()) {
    for (int size = 0; size < 256; ++size) {
      seed.bytes[0] = static_cast<char>(size);
      EXPECT_EQ(show(QVFuzzBusFrames(seed.bytes)), show(seed.progress)) << seed.name << " " << size;
    }
  }
}

// The properties that the target itself requires hold for bytes near the right ones.
TEST(QVFuzzBusFrames, AgreesWithItselfOnSeedsThatAreBroken) {
  std::size_t differing = 0;
  for (const auto& seed : QVFuzzBusSeeds()) {
    for (std::size_t length = 0; length < seed.bytes.size(); ++length) {
      QVFuzzBusFrames(seed.bytes.substr(0, length));
    }
    std::mt19937 random(1);
    for (std::size_t at = 1; at < seed.bytes.size(); ++at) {
      auto bytes = seed.bytes;
      bytes[at] = static_cast<char>(random());
      differing += QVFuzzBusFrames(bytes) == seed.progress ? 0 : 1;
    }
  }
  EXPECT_GT(differing, 1000U);
}
