#pragma once

// Publishes a driver's counters to the service, which reads them when a session starts and when it
// stops. C99 and C++, gcc or clang; nothing to link, so that it takes a processor that counts in 64
// bits without a lock. A program built with -std=c99 includes it first: it asks for POSIX.
//
//   static const char* const kSubgroups[] = {"pcm0p", "pcm1p"};
//   static const char* const kNames[] = {"frames", "underruns"};
//   QuietVoxChannels channels;
//   int error = quietvox_channels_create(&channels, "Speaker", kSubgroups, 2, kNames, 2);
//   ...
//   quietvox_channels_add(&channels, 0, 1, 1);  // an underrun of pcm0p
//   ...
//   quietvox_channels_close(&channels, QUIETVOX_CHANNELS_REMOVE);
//
// The counters lie in a file that is mapped: counting is one atomic addition, without a system
// call. The file appears whole, under its name, and replaces one that was there. Should the program
// crash the file stays, and what it counted can be read.
//
// The service looks for groups when it starts, so publish before that; a group that is replaced
// later is found again by its names.
//
// Threads: quietvox_channels_add() any, at once; the others one at a time. A child that was forked
// counts into the same file.

#ifndef _DEFAULT_SOURCE
#define _DEFAULT_SOURCE 1
#endif

#include <fcntl.h>

// The first header of a program settles what all others offer. A constant of POSIX tells.
#ifndef O_CLOEXEC
#error "include quietvox_channels.h before any other header, or build with -D_DEFAULT_SOURCE"
#endif
// Elsewhere the compiler would call for another library's lock, which no reader of the file takes.
#if !defined __GCC_ATOMIC_LLONG_LOCK_FREE || __GCC_ATOMIC_LLONG_LOCK_FREE != 2
#error "quietvox_channels.h needs 64-bit atomics without a lock, which this target does not have"
#endif

#include "quietvox_channels_mapping.h"

// Where the service looks for groups.
#define QUIETVOX_CHANNELS_DIRECTORY "/run/quietvox/channels"

// What becomes of the file when a driver ends in good order.
#define QUIETVOX_CHANNELS_KEEP 0
#define QUIETVOX_CHANNELS_REMOVE 1

// Publishes a group: `place` is its name, or with a "/" the path of its file, whose last part is
// the name. Every name has one to 63 bytes. Without subgroups (0 of them) the channels belong to
// the group itself. The file's mode is 0644 without what the umask takes away.
//
// Answers 0 or a negative error number: -ENAMETOOLONG for a longer name, -EINVAL for an empty one,
// for a group's that begins with "." and for no channels, -E2BIG for too many, else what the system
// says: -ENOENT where the directory is missing.
static inline int quietvox_channels_create(QuietVoxChannels* channels, const char* place,
                                           const char* const* subgroups, size_t subgroupCount,
                                           const char* const* names, size_t nameCount) {
  const char* const slash = strrchr(place, '/');
  const char* const group = slash == NULL ? place : slash + 1;
  int error = quietvox_channels_check(&group, 1);
  memset(channels, 0, sizeof *channels);
  if (error == 0) error = quietvox_channels_check(subgroups, subgroupCount);
  if (error == 0) error = quietvox_channels_check(names, nameCount);
  if (error != 0) return error;
  if (group[0] == '.' || nameCount == 0) return -EINVAL;
  if (nameCount * (subgroupCount == 0 ? 1 : subgroupCount) > QUIETVOX_CHANNELS_MAXIMUM) {
    return -E2BIG;
  }
  if (strlen(QUIETVOX_CHANNELS_DIRECTORY) + 1 + strlen(place) >= sizeof channels->path) {
    return -ENAMETOOLONG;
  }
  snprintf(channels->path, sizeof channels->path, "%s%s",
           slash == NULL ? QUIETVOX_CHANNELS_DIRECTORY "/" : "", place);
  channels->subgroups = subgroupCount;
  channels->names = nameCount;
  channels->bytes = quietvox_channels_bytes(subgroupCount, nameCount);
  error = quietvox_channels_publish(channels, subgroups, names);
  if (error != 0) memset(channels, 0, sizeof *channels);
  return error;
}

// Adds to the counter of a channel and a subgroup (0 where there are none), by their places in what
// was published. Other places count nothing.
static inline void quietvox_channels_add(QuietVoxChannels* channels, size_t subgroup, size_t name,
                                         uint64_t count) {
  const size_t rows = channels->subgroups == 0 ? 1 : channels->subgroups;
  if (subgroup >= rows || name >= channels->names) return;
  __atomic_fetch_add(&channels->values[name * rows + subgroup].cell, count, __ATOMIC_RELAXED);
}

// Ends counting, and removes the file where that is asked for and nobody has replaced it. Answers 0
// or a negative error number. Closing again does nothing.
static inline int quietvox_channels_close(QuietVoxChannels* channels, int keepOrRemove) {
  struct stat status;
  int error = 0;
  if (channels->file == NULL) return 0;
  if (munmap(channels->file, channels->bytes) != 0) error = -errno;
  if (keepOrRemove == QUIETVOX_CHANNELS_REMOVE && lstat(channels->path, &status) == 0 &&
      status.st_dev == channels->device && status.st_ino == channels->inode &&
      unlink(channels->path) != 0) {
    error = -errno;
  }
  memset(channels, 0, sizeof *channels);
  return error;
}
