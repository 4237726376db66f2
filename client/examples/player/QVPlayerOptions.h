#pragma once

#include "client/QVClientVocabulary.h"

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

// What the player's command line says. A value.
struct QVPlayerOptions {
  std::vector<std::string> files;
  std::string device = "null";
  std::string socket;  // empty: where the client library looks
  QVClientServiceType serviceType = QVClientServiceType::nonlongformaudio;
  int64_t reporterID = 0;  // set from the process ID unless given
  std::string application = "net.quillon.example.player";
  double speed = 1;                  // 0: as fast as the device takes it
  int volume = 50;                   // per cent, from the middle of a file on
  std::string route = "headphones";  // from the last quarter on
  bool haptics = false;
  bool help = false;

  // Nothing where the command line is wrong; `problem` then says how.
  static std::optional<QVPlayerOptions> parse(int argc, char** argv, std::string& problem);
  static const char* helpText();
};
