#pragma once

#include "platform/linux/tally/QVChannelSource.h"

#include <string>

// A group that a driver process publishes: DIRECTORY/GROUP, a file as QVMMVFormat describes it. The
// file is opened afresh at each reading, so that a publisher's replacement shows. Symbolic links
// are refused: a publisher names what is its own.
class QVMMVSource final : public QVChannelSource {
 public:
  // Readings of a file that is being written meanwhile, before it is given up with EAGAIN.
  static constexpr int kReadings = 3;

  QVMMVSource(const std::string& directory, std::string group);

  const std::string& group() const override { return group_; }
  int read(QVChannelReadings& readings) const override;

 private:
  const std::string group_;
  const std::string path_;
};
