#pragma once

#include "platform/QVLog.h"
#include "platform/QVValue.h"
#include "platform/linux/tally/QVKernelTextSource.h"

#include <cstddef>
#include <optional>
#include <string>
#include <vector>

// Reads which files of the kernel publish channels: one JSON array of objects,
//
//   [{"group": "Speaker", "subgroup": "pcm0p", "file": "/proc/asound/card0/pcm0p/sub0/status",
//     "channels": {"frames": "hw_ptr"}}]
//
// "subgroup" and "channels" may be missing, other keys are ignored. A file that is not there holds
// nothing. One that cannot be read or is no array counts as empty, and an error line on the default
// log names file, line and column. An entry of the wrong kinds is left out, and a channel whose key
// is no string, with an error line each.
//
// Threads: any; a plain function, called once as the service starts.
struct QVChannelConfiguration {
  // Entries of a file, far above any machine's sound cards; what is beyond is left out.
  static constexpr std::size_t kMaximumEntries = 256;
  // Channels that an entry names, far above the lines of such a file; what is beyond, in the order
  // of the names, is left out.
  static constexpr std::size_t kMaximumChannels = 1024;

  static std::vector<QVKernelTextSource::Description> read(QVLog& log, const std::string& path);
};
