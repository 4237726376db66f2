#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>

#include <alsa/asoundlib.h>

// An ALSA device that plays. The null device swallows everything at once; there the samples are
// handed over at the speed of a clock, no further ahead of it than the device's buffer, as a device
// that plays them would take them.
//
// Threads: one. write() waits for the device or the clock.
class QVPlayerOutput {
 public:
  // Null where the device cannot be used so; `problem` says why. `speed` counts on the null device
  // only, 0 means no clock.
  static std::unique_ptr<QVPlayerOutput> open(const std::string& device, unsigned rate,
                                              unsigned channels, double speed,
                                              std::string& problem);
  ~QVPlayerOutput();
  QVPlayerOutput(const QVPlayerOutput&) = delete;
  QVPlayerOutput& operator=(const QVPlayerOutput&) = delete;

  std::size_t bufferFrames() const { return bufferFrames_; }
  std::size_t periodFrames() const { return periodFrames_; }

  // Plays interleaved samples. False where the device failed for good; `problem` says why.
  bool write(const int16_t* samples, std::size_t frames, std::string& problem);
  // Waits until everything written has been played.
  void finish();

  // Frames written and not played yet.
  std::size_t bufferedFrames() const;
  // How often the device ran out of samples.
  unsigned underruns() const { return underruns_; }

 private:
  using Clock = std::chrono::steady_clock;

  QVPlayerOutput(snd_pcm_t* pcm, unsigned channels) : pcm_(pcm), channels_(channels) {}
  bool keepsTime() const { return framesPerSecond_ > 0; }
  int64_t playedByTheClock() const;
  void waitForTheClock(int64_t frames) const;

  snd_pcm_t* const pcm_;
  const unsigned channels_;
  std::size_t bufferFrames_ = 0;
  std::size_t periodFrames_ = 0;
  unsigned underruns_ = 0;
  double framesPerSecond_ = 0;  // of the clock; 0 without one
  Clock::time_point start_;     // when the first frame was written
  int64_t written_ = 0;
};
