// qv-player: plays sound files and reports them, as an example of a program that is instrumented
// with the client library.

#include "client/examples/player/QVPlayer.h"

#include <atomic>
#include <csignal>
#include <cstdio>
#include <memory>
#include <string>

namespace {

enum Status : int {
  kPlayed = 0,
  kFileProblem = 1,
  kWrongUsage = 2,
  kNoService = 3,
  kDeviceProblem = 4,
  kInterrupted = 130
};

std::atomic<bool> interrupted{false};
static_assert(std::atomic<bool>::is_always_lock_free);

void interrupt(int /*signal*/) {
  interrupted = true;
}

int complain(Status status, const std::string& what, const std::string& problem) {
  std::fprintf(stderr, "qv-player: %s: %s\n", what.c_str(), problem.c_str());
  return status;
}

int playFile(const std::string& path, const QVPlayerOptions& options,
             std::unique_ptr<QVPlayerReport>& report) {
  std::string problem;
  const auto file = QVPlayerFile::open(path, problem);
  if (!file) return complain(kFileProblem, path, problem);
  const auto output =
      QVPlayerOutput::open(options.device, file->rate(), file->channels(), options.speed, problem);
  if (!output) return complain(kDeviceProblem, "device " + options.device, problem);
  if (!report) report = QVPlayerReport::connect(options, problem);
  if (!report) return complain(kNoService, "reporting service", problem);

  std::printf("%s: %s, %u Hz, %u channel%s, %.2f s; reporter %lld\n", path.c_str(),
              file->format().c_str(), file->rate(), file->channels(),
              file->channels() == 1 ? "" : "s", static_cast<double>(file->frames()) / file->rate(),
              static_cast<long long>(options.reporterID));
  report->begin({file->rate(), file->channels(), output->bufferFrames(), output->periodFrames(),
                 options.device, file->format()});
  const bool played = QVPlayer(*file, *output, *report, options, interrupted).play(problem);
  report->end();
  std::printf("  %s: %u messages reported, %u not\n", played ? "done" : "failed",
              report->messagesAccepted(), report->messagesLost());
  if (!played) return complain(kFileProblem, path, problem);
  return kPlayed;
}

}  // namespace

int main(int argc, char** argv) {
  std::string problem;
  const auto options = QVPlayerOptions::parse(argc, argv, problem);
  if (!options) {
    std::fprintf(stderr, "qv-player: %s\nTry qv-player --help.\n", problem.c_str());
    return kWrongUsage;
  }
  if (options->help) {
    std::fputs(QVPlayerOptions::helpText(), stdout);
    return kPlayed;
  }
  // Lines appear as they are written, also in a pipe.
  static_cast<void>(std::setvbuf(stdout, nullptr, _IOLBF, 0));
  struct sigaction action {};
  action.sa_handler = interrupt;
  sigaction(SIGINT, &action, nullptr);
  sigaction(SIGTERM, &action, nullptr);

  std::unique_ptr<QVPlayerReport> report;
  int status = kPlayed;
  for (const std::string& path : options->files) {
    const int result = playFile(path, *options, report);
    if (interrupted) return kInterrupted;
    if (result == kNoService || result == kDeviceProblem) return result;
    if (result != kPlayed) status = result;
  }
  return status;
}
