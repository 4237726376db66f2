#pragma once

#include "platform/linux/tally/QVChannelSource.h"

#include <functional>
#include <map>
#include <optional>
#include <string>
#include <utility>
#include <vector>

// Channels that the kernel publishes in a text file, as the configuration names them: each line
// that counts (see QVKernelText), under its key or under the name that the configuration gives it.
class QVKernelTextSource final : public QVChannelSource {
 public:
  struct Description {
    std::string group;
    std::optional<std::string> subgroup;
    std::string file;
    // Names of channels with the keys of their lines, in ascending order of the names; absent: each
    // line is a channel named like its key.
    std::optional<std::vector<std::pair<std::string, std::string>>> channels;

    bool operator==(const Description&) const = default;
  };

  explicit QVKernelTextSource(Description description);

  const std::string& group() const override { return group_; }
  int read(QVChannelReadings& readings) const override;

 private:
  void addChannels(std::string_view line, QVChannelReadings& readings) const;

  const std::string group_;
  const std::optional<std::string> subgroup_;
  const std::string file_;
  // The configured names by the keys of their lines, those of a key in ascending order.
  std::optional<std::multimap<std::string, std::string, std::less<>>> names_;  // constant
};
