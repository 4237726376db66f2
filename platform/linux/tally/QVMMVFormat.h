#pragma once

#include "platform/linux/tally/QVChannelSource.h"

#include <cstddef>
#include <string_view>

// Files of PCP's "memory mapped values" format, version 1: a header, a table of contents, and the
// sections that it names, all in the byte order of the machine. A publisher maps the file and
// counts in the values' cells.
//
//   header    magic "MMV\0", version, generation twice, number of contents, flags, process, cluster
//   contents  kind, count, offset of each section
//   sections  1 instance domains, 2 instances, 3 metrics, 4 values, 5 texts
//   value     cell, extra, offset of its metric, offset of its instance
//
// The bytes are hostile: every count, offset and text is wrong until it was checked. Sections do
// not overlap, and an offset has to be that of an element of the section it points into.
//
// A metric is a channel and an instance a subgroup; a metric without a domain has no subgroup. The
// numbers' types are taken, of elapsed times the finished part in microseconds; texts and other
// types are no channels. In a file with the sentinel flag an integer's cell with all bits set and a
// NaN are no value. Whether the publisher still runs does not matter: what it counted is true.
//
// Threads: any; plain functions.
struct QVMMVFormat {
  // Bytes of a file; a channel takes 136 and its texts 512, so this is far more than a driver has.
  static constexpr std::size_t kMaximumBytes = std::size_t{1024} * 1024;
  // Sections of a file, one of each kind at the most.
  static constexpr int32_t kMaximumSections = 5;
  static constexpr std::size_t kHeaderBytes = 40;

  // Takes the bytes in; the readings' views point into them. Answers 0 or an error number:
  // EBADMSG for anything that is not in order, EAGAIN where the publisher is still writing,
  // ENOTSUP for another version of the format.
  [[nodiscard]] static int parse(std::string_view bytes, QVChannelReadings& readings);

  // Do both texts begin with the same header? Where they do not, the file was changed between.
  static bool sameHeader(std::string_view one, std::string_view other) {
    return one.substr(0, kHeaderBytes) == other.substr(0, kHeaderBytes);
  }
};
