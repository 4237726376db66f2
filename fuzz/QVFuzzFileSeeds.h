#pragma once

#include "fuzz/QVFuzzFiles.h"

#include <string>
#include <vector>

// One file to begin with, and how far it gets.
struct QVFuzzFileSeed {
  std::string name;
  std::string bytes;
  QVFuzzFileProgress progress;
};

// Files that between them reach every part of their reader. Pure.
std::vector<QVFuzzFileSeed> QVFuzzMMVSeeds();
std::vector<QVFuzzFileSeed> QVFuzzKernelTextSeeds();
std::vector<QVFuzzFileSeed> QVFuzzJSONFileSeeds();
std::vector<QVFuzzFileSeed> QVFuzzJSONScanSeeds();
