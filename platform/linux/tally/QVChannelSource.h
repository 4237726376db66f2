#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

// What one file publishes, as it was read once. The views point into `text`, or into the source
// that was read.
struct QVChannelReadings {
  struct Channel {
    std::optional<std::string_view> subgroup;
    std::string_view name;         // empty where it has none
    std::optional<int64_t> value;  // none where the channel has no value at the moment
  };

  QVChannelReadings() = default;
  QVChannelReadings(const QVChannelReadings&) = delete;
  QVChannelReadings& operator=(const QVChannelReadings&) = delete;

  std::string text;
  // The subgroups that there are, also those without channels; an absent one is the group itself.
  std::vector<std::optional<std::string_view>> subgroups;
  std::vector<Channel> channels;  // in the file's order
};

// A file that publishes channels of one group. Implemented for each kind of file; used by
// QVPublishedTally and what it hands out.
//
// Threads: any, at once: a source does not change.
class QVChannelSource {
 public:
  // Channels of a set, each of which costs every started session 16 bytes: what a source has beyond
  // these need not be read, but that there are more.
  static constexpr std::size_t kMaximumChannels = 4096;

  virtual ~QVChannelSource() = default;

  virtual const std::string& group() const = 0;
  // Reads the file once; never waits for anybody. Answers 0 or an error number, ENOENT where there
  // is no such file. `readings` is new, and holds nothing of use after a failure.
  [[nodiscard]] virtual int read(QVChannelReadings& readings) const = 0;
};
