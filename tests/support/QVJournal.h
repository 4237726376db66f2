#pragma once

#include "platform/QVPlatform.h"

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

// One list, in order, of what the core does to its platform: log lines, trace points, events that
// are handed to the event services and calls of the orientation service, with the replies that
// tests note in between. The fakes each keep their own list; only here does it show that a reply
// came before a line.
//
// Entries: "5[qvrs] -[QVReportingServerInstance killService:]: DESTROYING SERVICE", "trace
// 21042814", "countwise NAME", "joulewell NAME", "register device ID", "unregister ui ID",
// "reply ..." as the test words it.
//
// Threads: the one that runs the fake queues' items.
// Ownership: outlives the platform that it listens to.
class QVJournal {
 public:
  // Puts itself between the core and the platform's log, trace points, event services and
  // orientation service, which go on to receive everything.
  void listenTo(QVPlatform& platform);

  void note(std::string entry) { entries_.push_back(std::move(entry)); }
  const std::vector<std::string>& entries() const { return entries_; }
  // Those that begin with `prefix`.
  std::vector<std::string> entries(std::string_view prefix) const;
  // All entries; they are forgotten.
  std::vector<std::string> take();
  void forget() { entries_.clear(); }

 private:
  std::vector<std::string> entries_;
};

// Entries as the journal has them.
std::string logEntry(QVLogLevel level, std::string_view scope, std::string_view function,
                     std::string_view text);
std::string traceEntry(uint32_t code);
