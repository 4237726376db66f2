#pragma once

#include "tools/qvctl/QVToolPlaces.h"

#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <tuple>
#include <vector>

// What drivers publish, read from their files as the service reads them; nobody notices.
//
// Threads: one at a time. A file that cannot be read costs a line on standard error, and the others
// are read.
class QVChannelTable {
 public:
  struct Channel {
    std::string group;
    std::string subgroup;  // empty where it has none
    std::string name;
    std::optional<int64_t> value;   // none where it has none at the moment
    std::optional<int64_t> growth;  // since the last reading, where it was there then
  };
  using Channels = std::vector<Channel>;

  // `group`: this one alone; empty: all.
  QVChannelTable(const QVToolPlaces& places, std::string group)
      : places_(places), group_(std::move(group)) {}

  // All channels, in the order of their files. Failures: QVToolFailure, notPermitted where the
  // directory is closed to this user.
  Channels read();

 private:
  // A channel, and which one of those of the same names.
  using Key = std::tuple<std::string, std::string, std::string, std::size_t>;

  std::vector<std::string> publishedGroups() const;
  void addGrowth(Channels& channels);

  const QVToolPlaces& places_;
  const std::string group_;
  std::map<Key, int64_t> earlier_;
};
