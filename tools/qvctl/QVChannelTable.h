#pragma once

#include "platform/linux/tally/QVChannelSource.h"
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
// Threads: one at a time.
class QVChannelTable {
 public:
  struct Channel {
    std::string group;
    std::string subgroup;  // empty where it has none
    std::string name;
    std::optional<int64_t> value;   // none where it has none at the moment
    std::optional<int64_t> growth;  // since the last reading, where it was there then
  };
  // A file that could not be read, or not all of it, and why.
  struct Unreadable {
    std::string path;
    std::string error;
    bool operator==(const Unreadable&) const = default;
  };
  struct Reading {
    std::vector<Channel> channels;  // in the order of their files
    std::vector<Unreadable> unreadable;
  };

  // `group`: this one alone; empty: all.
  QVChannelTable(const QVToolPlaces& places, std::string group)
      : places_(places), group_(std::move(group)) {}

  // All channels; what cannot be read is left out, and said. Failures: QVToolFailure, notPermitted
  // where the directory is closed to this user; failed where the first reading finds no such group.
  Reading read();

 private:
  // A channel, and which one of those of the same names.
  using Key = std::tuple<std::string, std::string, std::string, std::size_t>;
  // What may publish: a file, and how it is read.
  struct File;

  std::vector<std::string> publishedGroups() const;
  std::vector<File> files(Reading& reading) const;
  void selectGroup(std::vector<File>& files) const;
  void addGrowth(std::vector<Channel>& channels);

  const QVToolPlaces& places_;
  const std::string group_;
  bool isFirst_ = true;
  std::map<Key, int64_t> earlier_;
};
