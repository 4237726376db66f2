#include "client/examples/player/QVPlayerOutput.h"

#include <algorithm>
#include <thread>

namespace {

// Microseconds of audio in the device's buffer; what a media player asks for.
constexpr unsigned kLatency = 200'000;

// The library would print its troubles itself; they are in the error numbers as well. Variadic,
// because the library calls it so.
// NOLINTNEXTLINE(cert-dcl50-cpp)
void ignoreLine(const char* /*file*/, int /*line*/, const char* /*function*/, int /*number*/,
                const char* /*format*/, ...) {}

}  // namespace

std::unique_ptr<QVPlayerOutput> QVPlayerOutput::open(const std::string& device, unsigned rate,
                                                     unsigned channels, double speed,
                                                     std::string& problem) {
  snd_lib_error_set_handler(ignoreLine);
  snd_pcm_t* pcm = nullptr;
  int result = snd_pcm_open(&pcm, device.c_str(), SND_PCM_STREAM_PLAYBACK, 0);
  if (result < 0) {
    problem = snd_strerror(result);
    return nullptr;
  }
  std::unique_ptr<QVPlayerOutput> output(new QVPlayerOutput(pcm, channels));
  snd_pcm_uframes_t buffer = 0;
  snd_pcm_uframes_t period = 0;
  result = snd_pcm_set_params(pcm, SND_PCM_FORMAT_S16, SND_PCM_ACCESS_RW_INTERLEAVED, channels,
                              rate, 1, kLatency);
  if (result >= 0) result = snd_pcm_get_params(pcm, &buffer, &period);
  if (result < 0) {
    problem = std::to_string(rate) + " Hz, " + std::to_string(channels) +
              " channels: " + snd_strerror(result);
    return nullptr;
  }
  output->bufferFrames_ = buffer;
  output->periodFrames_ = std::max<snd_pcm_uframes_t>(period, 1);
  if (snd_pcm_type(pcm) == SND_PCM_TYPE_NULL) output->framesPerSecond_ = rate * speed;
  return output;
}

QVPlayerOutput::~QVPlayerOutput() {
  snd_pcm_close(pcm_);
}

bool QVPlayerOutput::write(const int16_t* samples, std::size_t frames, std::string& problem) {
  if (written_ == 0) start_ = Clock::now();
  if (keepsTime()) {
    waitForTheClock(written_ + static_cast<int64_t>(frames) - static_cast<int64_t>(bufferFrames_));
  }
  while (frames > 0) {
    const snd_pcm_sframes_t taken = snd_pcm_writei(pcm_, samples, frames);
    if (taken < 0) {
      if (taken == -EPIPE) ++underruns_;
      const int result = snd_pcm_recover(pcm_, static_cast<int>(taken), 1);
      if (result < 0) {
        problem = snd_strerror(result);
        return false;
      }
      continue;
    }
    const auto count = static_cast<std::size_t>(taken);
    samples += count * channels_;
    frames -= count;
    written_ += taken;
  }
  return true;
}

void QVPlayerOutput::finish() {
  if (keepsTime()) waitForTheClock(written_);
  snd_pcm_drain(pcm_);
}

std::size_t QVPlayerOutput::bufferedFrames() const {
  if (keepsTime())
    return static_cast<std::size_t>(std::max<int64_t>(written_ - playedByTheClock(), 0));
  const snd_pcm_sframes_t free = snd_pcm_avail(pcm_);
  if (free < 0 || static_cast<std::size_t>(free) > bufferFrames_) return 0;
  return bufferFrames_ - static_cast<std::size_t>(free);
}

int64_t QVPlayerOutput::playedByTheClock() const {
  const std::chrono::duration<double> passed = Clock::now() - start_;
  return static_cast<int64_t>(passed.count() * framesPerSecond_);
}

// Until so many frames have been played.
void QVPlayerOutput::waitForTheClock(int64_t frames) const {
  if (frames <= 0) return;
  const std::chrono::duration<double> time(static_cast<double>(frames) / framesPerSecond_);
  std::this_thread::sleep_until(start_ + std::chrono::duration_cast<Clock::duration>(time));
}
