#include "client/examples/player/QVPlayerOptions.h"

#include <array>
#include <charconv>
#include <string_view>

#include <getopt.h>
#include <unistd.h>

namespace {

// Far above what any device plays at, and far from overflowing a clock.
constexpr double kHighestSpeed = 1000;

enum Option : int {
  kDevice = 'D',
  kSocket = 's',
  kHelp = 'h',
  kServiceType = 256,
  kReporterID,
  kApplication,
  kSpeed,
  kVolume,
  kRoute,
  kHaptics
};

constexpr std::array<option, 11> kOptions{
    {{"device", required_argument, nullptr, kDevice},
     {"socket", required_argument, nullptr, kSocket},
     {"service-type", required_argument, nullptr, kServiceType},
     {"reporter-id", required_argument, nullptr, kReporterID},
     {"application", required_argument, nullptr, kApplication},
     {"speed", required_argument, nullptr, kSpeed},
     {"volume", required_argument, nullptr, kVolume},
     {"route", required_argument, nullptr, kRoute},
     {"haptics", no_argument, nullptr, kHaptics},
     {"help", no_argument, nullptr, kHelp},
     {nullptr, 0, nullptr, 0}}};

template <class Number>
bool readNumber(std::string_view text, Number least, Number most, Number& number) {
  Number read{};
  const auto [end, problem] = std::from_chars(text.data(), text.data() + text.size(), read);
  // Written so that NaN is refused.
  if (problem != std::errc() || end != text.data() + text.size()) return false;
  if (!(read >= least && read <= most)) return false;
  number = read;
  return true;
}

// What is wrong with the option's argument; empty where nothing is.
std::string take(QVPlayerOptions& options, int option, const std::string& argument) {
  switch (option) {
    case kDevice:
      options.device = argument;
      return {};
    case kSocket:
      options.socket = argument;
      return {};
    case kApplication:
      options.application = argument;
      return {};
    case kRoute:
      options.route = argument;
      return {};
    case kHaptics:
      options.haptics = true;
      return {};
    case kHelp:
      options.help = true;
      return {};
    case kServiceType: {
      const auto serviceType = QVClientServiceTypeNamed(argument);
      if (!serviceType) return "there is no service type \"" + argument + "\"";
      options.serviceType = *serviceType;
      return {};
    }
    case kReporterID:
      if (readNumber<int64_t>(argument, INT64_MIN, INT64_MAX, options.reporterID) &&
          options.reporterID != 0) {
        return {};
      }
      return "a reporter ID is a number of 64 bits other than 0, not \"" + argument + "\"";
    case kSpeed:
      if (readNumber<double>(argument, 0, kHighestSpeed, options.speed)) return {};
      return "the speed is a number from 0 to 1000, not \"" + argument + "\"";
    case kVolume:
      if (readNumber(argument, 0, 100, options.volume)) return {};
      return "the volume is a number from 0 to 100, not \"" + argument + "\"";
    default:
      return "an option is unknown or lacks its argument";
  }
}

}  // namespace

std::optional<QVPlayerOptions> QVPlayerOptions::parse(int argc, char** argv, std::string& problem) {
  QVPlayerOptions options;
  options.reporterID = getpid();
  opterr = 0;
  const auto next = [argc, argv] {
    // Before any other thread is there.
    // NOLINTNEXTLINE(concurrency-mt-unsafe)
    return getopt_long(argc, argv, "D:s:h", kOptions.data(), nullptr);
  };
  for (int option = next(); option != -1; option = next()) {
    problem = take(options, option, optarg != nullptr ? optarg : "");
    if (!problem.empty()) return std::nullopt;
  }
  options.files.assign(argv + optind, argv + argc);
  if (options.files.empty() && !options.help) {
    problem = "no file to play";
    return std::nullopt;
  }
  return options;
}

const char* QVPlayerOptions::helpText() {
  return R"(usage: qv-player [options] FILE...

Plays sound files (WAV, FLAC, Ogg and whatever else libsndfile reads) through ALSA, and reports each
as a session to the QuietVox reporting service: its format, its start, every second of audio, a
change of volume in the middle, a change of route at three quarters, its end.

  -D, --device NAME      ALSA device to play on (default: null, which needs no sound card)
  -s, --socket PATH      the service's socket (default: $QUIETVOX_SOCKET, else
                         /run/quietvox/reporting.socket)
      --service-type T   what the session is for, by name or number (default: nonlongformaudio)
      --reporter-id N    the session's reporter ID (default: this process's ID)
      --application ID   HostApplicationDisplayID (default: net.quillon.example.player)
      --speed N          times real time on the null device, which takes audio at any speed;
                         0 = as fast as it goes (default: 1; other devices keep their own time)
      --volume PERCENT   volume from the middle of each file on (default: 50)
      --route NAME       route reported from the last quarter on (default: headphones)
      --haptics          report an engine that runs along with loud passages
  -h, --help             this text

If the service goes away, the player says so once and goes on playing.

exit status: 0 everything was played; 1 a file could not be played; 2 wrong usage; 3 the service could
not be reached; 4 the device could not be used; 130 interrupted

example: qv-player --speed 0 /usr/share/sounds/alsa/Front_Center.wav
)";
}
