#pragma once

// The inside of quietvox_channels.h: what a published file is, and how it comes to be.

#include "quietvox_channels_file.h"

#include <errno.h>
#include <fcntl.h>
#include <stdio.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

// Counters of a file, channels times subgroups; the service reads no more.
#define QUIETVOX_CHANNELS_MAXIMUM 4096
// Bytes of a file's path, with the NUL that ends it.
#define QUIETVOX_CHANNELS_PATH_BYTES 1024

// One published file. Zeros, as after a failed creation or a close, count nothing.
typedef struct QuietVoxChannels {
  QuietVoxFileHeader* file;
  QuietVoxFileValue* values;
  size_t bytes;
  size_t subgroups;  // 0 where the channels belong to the group itself
  size_t names;
  dev_t device;
  ino_t inode;
  char path[QUIETVOX_CHANNELS_PATH_BYTES];
} QuietVoxChannels;

// Bytes of the whole file.
static inline size_t quietvox_channels_bytes(size_t subgroups, size_t channels) {
  const size_t head = sizeof(QuietVoxFileHeader) + channels * sizeof(QuietVoxFileMetric);
  if (subgroups == 0) {
    return head + 2 * sizeof(QuietVoxFileSection) + channels * sizeof(QuietVoxFileValue);
  }
  return head + 4 * sizeof(QuietVoxFileSection) + sizeof(QuietVoxFileDomain) +
         subgroups * (sizeof(QuietVoxFileInstance) + channels * sizeof(QuietVoxFileValue));
}

static inline int quietvox_channels_check(const char* const* names, size_t count) {
  size_t i;
  if (count > QUIETVOX_CHANNELS_MAXIMUM) return -E2BIG;
  for (i = 0; i < count; ++i) {
    if (names[i][0] == '\0') return -EINVAL;
    if (strlen(names[i]) >= QUIETVOX_CHANNELS_NAME_BYTES) return -ENAMETOOLONG;
  }
  return 0;
}

// Maps the new, empty file of that descriptor.
static inline int quietvox_channels_map(QuietVoxChannels* channels, int descriptor) {
  struct stat status;
  void* mapped;
  int full;
  // Takes the space now: later, a full disk would end the program. A signal may cut it short.
  do {
    full = posix_fallocate(descriptor, 0, (off_t)channels->bytes);
  } while (full == EINTR);
  if (full != 0) return -full;
  if (fstat(descriptor, &status) != 0) return -errno;
  mapped = mmap(NULL, channels->bytes, PROT_READ | PROT_WRITE, MAP_SHARED, descriptor, 0);
  if (mapped == MAP_FAILED) return -errno;
  channels->file = (QuietVoxFileHeader*)mapped;
  channels->device = status.st_dev;
  channels->inode = status.st_ino;
  return 0;
}

static inline void quietvox_channels_finish(QuietVoxFileHeader* file) {
  struct timespec now;
  clock_gettime(CLOCK_REALTIME, &now);
  file->process = (int32_t)getpid();
  file->generation = (uint64_t)now.tv_sec * 1000000000U + (uint64_t)now.tv_nsec;
  file->generationAgain = file->generation;
}

// Makes the file under a name that no reader takes for a group's, then gives it its own.
static inline int quietvox_channels_publish(QuietVoxChannels* channels,
                                            const char* const* subgroups,
                                            const char* const* names) {
  char made[QUIETVOX_CHANNELS_PATH_BYTES + 32];
  const char* const group = strrchr(channels->path, '/') + 1;
  int error = 0;
  int descriptor = -1;
  snprintf(made, sizeof made, "%.*s.%s.%ld", (int)(group - channels->path), channels->path, group,
           (long)getpid());
  unlink(made);  // of a process that had this number, and crashed
  descriptor = open(made, O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, 0644);
  if (descriptor < 0) return -errno;
  error = quietvox_channels_map(channels, descriptor);
  close(descriptor);
  if (error == 0) {
    channels->values =
        quietvox_file_fill(channels->file, subgroups, channels->subgroups, names, channels->names);
    quietvox_channels_finish(channels->file);
    if (rename(made, channels->path) != 0) error = -errno;
  }
  if (error != 0) unlink(made);
  if (error != 0 && channels->file != NULL) munmap(channels->file, channels->bytes);
  return error;
}
