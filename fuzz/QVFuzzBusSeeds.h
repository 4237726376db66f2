#pragma once

#include "fuzz/QVFuzzBusFrames.h"

#include <string>
#include <vector>

// One input to begin with, and how far it gets.
struct QVFuzzBusSeed {
  std::string name;
  std::string bytes;
  QVFuzzBusProgress progress;
};

// Inputs that between them reach every part of the protocol. Pure.
std::vector<QVFuzzBusSeed> QVFuzzBusSeeds();
