#include "client/examples/player/QVPlayer.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstdio>

namespace {

// Amplitude above which a haptic engine would run along.
constexpr float kLoud = 0.1F;

constexpr float kFullScale = 32767;

}  // namespace

QVPlayer::QVPlayer(QVPlayerFile& file, QVPlayerOutput& output, QVPlayerReport& report,
                   const QVPlayerOptions& options, const std::atomic<bool>& interrupted)
    : file_(file),
      output_(output),
      report_(report),
      options_(options),
      interrupted_(interrupted),
      decoded_(output.periodFrames() * file.channels()),
      samples_(decoded_.size()) {}

bool QVPlayer::play(std::string& problem) {
  report_.playbackStarted();
  while (!interrupted_) {
    const auto begin = std::chrono::steady_clock::now();
    const std::size_t frames = file_.read(decoded_.data(), output_.periodFrames());
    if (frames == 0) break;
    process(frames);
    const auto spent = std::chrono::steady_clock::now() - begin;
    progress_.processingMicroseconds +=
        std::chrono::duration_cast<std::chrono::microseconds>(spent).count();
    if (!output_.write(samples_.data(), frames, problem)) break;
    progress_.frames += static_cast<int64_t>(frames);
    changeWhatIsDue();
    if (progress_.frames - reportedFrames_ >= file_.rate()) reportProgress();
  }
  if (problem.empty()) problem = file_.fault();
  if (progress_.frames != reportedFrames_) reportProgress();
  const bool completely = problem.empty() && !interrupted_;
  if (completely) output_.finish();
  report_.playbackStopped(progress_, completely);
  return problem.empty();
}

void QVPlayer::process(std::size_t frames) {
  const std::size_t channels = file_.channels();
  for (std::size_t frame = 0; frame < frames; ++frame) {
    float peak = 0;
    for (std::size_t channel = 0; channel < channels; ++channel) {
      const std::size_t at = frame * channels + channel;
      const float sample = std::clamp(decoded_[at] * gain_, -1.0F, 1.0F);
      peak = std::max(peak, std::abs(sample));
      samples_[at] = static_cast<int16_t>(std::lrint(sample * kFullScale));
    }
    if (peak > kLoud) ++loudFrames_;
  }
}

void QVPlayer::changeWhatIsDue() {
  if (!volumeChanged_ && 2 * progress_.frames >= file_.frames()) {
    volumeChanged_ = true;
    gain_ = static_cast<float>(options_.volume) / 100;
    std::printf("  volume %d %%\n", options_.volume);
    report_.volumeChanged(options_.volume);
  }
  if (!routeChanged_ && progress_.frames / 3 >= file_.frames() / 4) {
    routeChanged_ = true;
    std::printf("  route %s\n", options_.route.c_str());
    report_.routeChanged(options_.route);
  }
}

void QVPlayer::reportProgress() {
  progress_.position = secondsOf(progress_.frames);
  progress_.bufferedFrames = output_.bufferedFrames();
  progress_.underruns = output_.underruns();
  progress_.engineSeconds = options_.haptics ? secondsOf(loudFrames_) : 0;
  std::printf("  %6.2f s  %lld frames, buffer %zu of %zu, %u xruns, %lld us\n", progress_.position,
              static_cast<long long>(progress_.frames), progress_.bufferedFrames,
              output_.bufferFrames(), progress_.underruns,
              static_cast<long long>(progress_.processingMicroseconds));
  report_.progressed(progress_);
  reportedFrames_ = progress_.frames;
  progress_.processingMicroseconds = 0;
  loudFrames_ = 0;
}

double QVPlayer::secondsOf(int64_t frames) const {
  return static_cast<double>(frames) / file_.rate();
}
