#include "fuzz/QVFuzzBusSeeds.h"

#include <filesystem>
#include <fstream>
#include <iostream>

// Writes the seeds into a directory, one file each.
int main(int count, char** arguments) {
  if (count != 2) {
    std::cerr << "usage: qv_make_bus_seeds DIRECTORY\n";
    return 2;
  }
  const std::filesystem::path directory = arguments[1];
  std::filesystem::create_directories(directory);
  for (const auto& seed : QVFuzzBusSeeds()) {
    std::ofstream file(directory / seed.name, std::ios::binary);
    file << seed.bytes;
    if (!file.flush()) {
      std::cerr << "cannot write " << directory / seed.name << "\n";
      return 1;
    }
  }
  return 0;
}
