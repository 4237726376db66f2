#include "fuzz/QVFuzzFileSeeds.h"

#include <filesystem>
#include <fstream>
#include <iostream>

namespace {

bool write(const std::filesystem::path& directory, const std::vector<QVFuzzFileSeed>& seeds) {
  std::filesystem::create_directories(directory);
  for (const auto& seed : seeds) {
    std::ofstream file(directory / seed.name, std::ios::binary);
    file << seed.bytes;
    if (!file.flush()) {
      std::cerr << "cannot write " << directory / seed.name << "\n";
      return false;
    }
  }
  return true;
}

}  // namespace

// Writes the seeds of each reader into a folder of its own, one file each.
int main(int count, char** arguments) {
  if (count != 2) {
    std::cerr << "usage: qv_make_file_seeds DIRECTORY\n";
    return 2;
  }
  const std::filesystem::path directory = arguments[1];
  const bool written = write(directory / "mmv", QVFuzzMMVSeeds()) &&
                       write(directory / "kernel-text", QVFuzzKernelTextSeeds()) &&
                       write(directory / "json-file", QVFuzzJSONFileSeeds()) &&
                       write(directory / "json-scan", QVFuzzJSONScanSeeds());
  return written ? 0 : 1;
}
