// A stand-in for an audio driver: publishes counters of one group and lets them grow, for a bounded
// number of rounds. Shows how a driver publishes with quietvox_channels.h, and drives the demo and
// the tests.

#include "client/quietvox_channels.h"

#include <limits.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/select.h>

// What a command line may ask for.
#define MAXIMUM_NAMES 16
#define MAXIMUM_ROUNDS 1000000
#define MAXIMUM_INTERVAL_MS 60000

typedef struct Options {
  const char* place;
  const char* subgroups[MAXIMUM_NAMES];
  size_t subgroupCount;
  const char* channels[MAXIMUM_NAMES];
  size_t channelCount;
  long step;
  long rounds;
  long interval;
  int onInput;
  int end;
} Options;

static const char kHelp[] =
    "usage: qv-driver [OPTION]... GROUP\n"
    "\n"
    "Publishes counters of GROUP, a name or the path of a file, and lets each grow once a round.\n"
    "Writes \"published\" when they can be read, and ends after the last round.\n"
    "\n"
    "  --subgroup NAME   a subgroup; up to 16 times; without it the group has none\n"
    "  --channel NAME    a counter; up to 16 times (default: frames)\n"
    "  --step N          what a counter grows by in a round (default: 1)\n"
    "  --rounds N        how many rounds, at most 1000000 (default: 10)\n"
    "  --interval MS     milliseconds between two rounds, at most 60000 (default: 1000)\n"
    "  --on-input        a round for each line of standard input instead of time, answered with\n"
    "                    its number; ends with the input\n"
    "  --keep            leaves the file where it is\n"
    "  --help            prints this\n"
    "\n"
    "Exit status: 0, 1 where the group cannot be published, 2 for a wrong command line.\n";

// Signals are told by the wait that they end.
static void interrupt(int number) {
  (void)number;
}

static int refuse(const char* what, const char* argument) {
  fprintf(stderr, "qv-driver: %s: %s (see --help)\n", what, argument);
  return 2;
}

// A number of the range, or -1.
static long number(const char* text, long most) {
  char* rest = NULL;
  errno = 0;
  const long value = strtol(text, &rest, 10);
  if (errno != 0 || rest == text || *rest != '\0' || value < 0 || value > most) return -1;
  return value;
}

// Takes an option that has a value; 0, or the exit status.
static int take(Options* options, const char* name, const char* value) {
  long* target = NULL;
  long most = 0;
  if (strcmp(name, "--subgroup") == 0 || strcmp(name, "--channel") == 0) {
    const char** names = name[2] == 's' ? options->subgroups : options->channels;
    size_t* count = name[2] == 's' ? &options->subgroupCount : &options->channelCount;
    if (*count == MAXIMUM_NAMES) return refuse("one name too many", value);
    names[(*count)++] = value;
    return 0;
  }
  if (strcmp(name, "--step") == 0) {
    target = &options->step;
    most = LONG_MAX;
  } else if (strcmp(name, "--rounds") == 0) {
    target = &options->rounds;
    most = MAXIMUM_ROUNDS;
  } else if (strcmp(name, "--interval") == 0) {
    target = &options->interval;
    most = MAXIMUM_INTERVAL_MS;
  } else {
    return refuse("unknown option", name);
  }
  *target = number(value, most);
  return *target < 0 ? refuse("no number of the range", value) : 0;
}

static int parse(Options* options, int count, char** arguments) {
  for (int i = 1; i < count; ++i) {
    const char* const argument = arguments[i];
    if (strcmp(argument, "--on-input") == 0) {
      options->onInput = 1;
    } else if (strcmp(argument, "--keep") == 0) {
      options->end = QUIETVOX_CHANNELS_KEEP;
    } else if (argument[0] != '-') {
      if (options->place != NULL) return refuse("one group too many", argument);
      options->place = argument;
    } else if (i + 1 == count) {
      return refuse("unknown option, or nothing behind it", argument);
    } else {
      const int status = take(options, argument, arguments[++i]);
      if (status != 0) return status;
    }
  }
  if (options->place == NULL) return refuse("no group", "GROUP");
  if (options->channelCount == 0) options->channels[options->channelCount++] = "frames";
  return 0;
}

static void count(QuietVoxChannels* channels, const Options* options) {
  const size_t rows = options->subgroupCount == 0 ? 1 : options->subgroupCount;
  for (size_t name = 0; name < options->channelCount; ++name) {
    for (size_t row = 0; row < rows; ++row) {
      quietvox_channels_add(channels, row, name, (uint64_t)options->step);
    }
  }
}

// Waits for the time to pass, or without a limit for input; false where the program is told to end.
// Signals come nowhere else, so that none comes too early to end the wait.
static int await(const struct timespec* limit) {
  fd_set input;
  sigset_t none;
  sigemptyset(&none);
  FD_ZERO(&input);
  if (limit == NULL) FD_SET(STDIN_FILENO, &input);
  return pselect(STDIN_FILENO + 1, &input, NULL, NULL, limit, &none) >= 0 || errno != EINTR;
}

static void countByTime(QuietVoxChannels* channels, const Options* options) {
  struct timespec pause;
  pause.tv_sec = options->interval / 1000;
  pause.tv_nsec = options->interval % 1000 * 1000000;
  for (long round = 0; round < options->rounds; ++round) {
    count(channels, options);
    if (!await(&pause)) return;
  }
}

static void countByInput(QuietVoxChannels* channels, const Options* options) {
  long round = 0;
  while (round < options->rounds) {
    char byte;
    if (!await(NULL) || read(STDIN_FILENO, &byte, 1) != 1) return;
    if (byte != '\n') continue;
    count(channels, options);
    printf("%ld\n", ++round);
    fflush(stdout);
  }
}

int main(int argumentCount, char** arguments) {
  Options options;
  QuietVoxChannels channels;
  struct sigaction action;
  sigset_t ends;
  int error = 0;
  memset(&options, 0, sizeof options);
  options.step = 1;
  options.rounds = 10;
  options.interval = 1000;
  options.end = QUIETVOX_CHANNELS_REMOVE;
  for (int i = 1; i < argumentCount; ++i) {
    if (strcmp(arguments[i], "--help") == 0) return fputs(kHelp, stdout) < 0 ? 1 : 0;
  }
  const int status = parse(&options, argumentCount, arguments);
  if (status != 0) return status;

  error = quietvox_channels_create(&channels, options.place, options.subgroups,
                                   options.subgroupCount, options.channels, options.channelCount);
  if (error != 0) {
    fprintf(stderr, "qv-driver: cannot publish %s: %s\n", options.place, strerror(-error));
    return 1;
  }
  // They end the rounds, so that the file goes as well.
  memset(&action, 0, sizeof action);
  action.sa_handler = interrupt;
  sigemptyset(&ends);
  sigaddset(&ends, SIGTERM);
  sigaddset(&ends, SIGINT);
  sigprocmask(SIG_BLOCK, &ends, NULL);
  sigaction(SIGTERM, &action, NULL);
  sigaction(SIGINT, &action, NULL);
  puts("published");
  fflush(stdout);
  if (options.onInput) {
    countByInput(&channels, &options);
  } else {
    countByTime(&channels, &options);
  }
  return quietvox_channels_close(&channels, options.end) == 0 ? 0 : 1;
}
