#pragma once

#include "client/examples/player/QVPlayerFile.h"
#include "client/examples/player/QVPlayerOptions.h"
#include "client/examples/player/QVPlayerOutput.h"
#include "client/examples/player/QVPlayerReport.h"

#include <atomic>
#include <cstdint>
#include <string>
#include <vector>

// Plays one file and reports it. Made for that file; refers to what it is given.
//
// Threads: the player's; `interrupted` may be set by a signal handler.
class QVPlayer {
 public:
  QVPlayer(QVPlayerFile& file, QVPlayerOutput& output, QVPlayerReport& report,
           const QVPlayerOptions& options, const std::atomic<bool>& interrupted);

  // To the end, or until interrupted. False where the device or the file failed; `problem` says
  // why.
  bool play(std::string& problem);

 private:
  void process(std::size_t frames);
  void changeWhatIsDue();
  void reportProgress();
  double secondsOf(int64_t frames) const;

  QVPlayerFile& file_;
  QVPlayerOutput& output_;
  QVPlayerReport& report_;
  const QVPlayerOptions& options_;
  const std::atomic<bool>& interrupted_;

  std::vector<float> decoded_;
  std::vector<int16_t> samples_;
  float gain_ = 1;
  bool volumeChanged_ = false;
  bool routeChanged_ = false;
  int64_t loudFrames_ = 0;  // since the last progress
  int64_t reportedFrames_ = 0;
  QVPlayerProgress progress_;
};
