#include "client/examples/player/QVPlayerFile.h"

namespace {

std::string nameOf(int command, int format) {
  SF_FORMAT_INFO information{};
  information.format = format;
  if (sf_command(nullptr, command, &information, sizeof information) != 0) return "?";
  return information.name;
}

}  // namespace

std::unique_ptr<QVPlayerFile> QVPlayerFile::open(const std::string& path, std::string& problem) {
  SF_INFO information{};
  SNDFILE* file = sf_open(path.c_str(), SFM_READ, &information);
  if (file == nullptr) {
    problem = sf_strerror(nullptr);
    // The library's texts end with a full stop here, with a line's end there.
    while (!problem.empty() && (problem.back() == '\n' || problem.back() == '.')) {
      problem.pop_back();
    }
    return nullptr;
  }
  return std::unique_ptr<QVPlayerFile>(new QVPlayerFile(file, information));
}

QVPlayerFile::~QVPlayerFile() {
  static_cast<void>(sf_close(file_));
}

std::string QVPlayerFile::format() const {
  return nameOf(SFC_GET_FORMAT_INFO, information_.format & SF_FORMAT_TYPEMASK) + ", " +
         nameOf(SFC_GET_FORMAT_INFO, information_.format & SF_FORMAT_SUBMASK);
}

std::size_t QVPlayerFile::read(float* samples, std::size_t count) {
  const sf_count_t frames = sf_readf_float(file_, samples, static_cast<sf_count_t>(count));
  return frames > 0 ? static_cast<std::size_t>(frames) : 0;
}

std::string QVPlayerFile::fault() const {
  return sf_error(file_) == SF_ERR_NO_ERROR ? "" : sf_strerror(file_);
}
