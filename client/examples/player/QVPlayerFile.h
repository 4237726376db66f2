#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>

#include <sndfile.h>

// A sound file, decoded while it is read. Threads: one.
class QVPlayerFile {
 public:
  // Null where it cannot be read; `problem` says why.
  static std::unique_ptr<QVPlayerFile> open(const std::string& path, std::string& problem);
  ~QVPlayerFile();
  QVPlayerFile(const QVPlayerFile&) = delete;
  QVPlayerFile& operator=(const QVPlayerFile&) = delete;

  unsigned rate() const { return static_cast<unsigned>(information_.samplerate); }
  unsigned channels() const { return static_cast<unsigned>(information_.channels); }
  int64_t frames() const { return information_.frames; }
  // "WAV (Microsoft), Signed 16 bit PCM".
  std::string format() const;

  // Reads up to `count` frames; fewer only at the end or at a fault.
  std::size_t read(float* samples, std::size_t count);
  // Why the file ended too early; empty where it did not.
  std::string fault() const;

 private:
  QVPlayerFile(SNDFILE* file, const SF_INFO& information)
      : file_(file), information_(information) {}

  SNDFILE* const file_;
  const SF_INFO information_;
};
