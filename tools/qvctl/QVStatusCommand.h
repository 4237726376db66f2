#pragma once

#include "tools/qvctl/QVServiceState.h"
#include "tools/qvctl/QVToolContext.h"
#include "tools/qvctl/QVToolFailure.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <utility>
#include <vector>

// qvctl status: does the service run, since when, for whom, what has it stored and lost. A service
// that starts on demand is not started by being asked for, unless that is wanted.
//
// Threads: one.
class QVStatusCommand {
 public:
  struct Options {
    bool start = false;
  };

  // done where the service runs, else notRunning.
  static QVToolStatus run(const QVToolContext& context, const Options& options);

 private:
  struct Store {
    bool isThere = false;
    int64_t bytes = 0;
    int64_t sessions = 0;
    int64_t messages = 0;
    int64_t analytics = 0;
    int64_t energy = 0;
    std::vector<std::pair<std::string, int64_t>> losses;  // by cause
    std::string problem;                                  // why it cannot be read
  };
  struct Findings {
    QVServiceState state;
    std::optional<std::size_t> sessions;
    std::optional<bool> isReporting;  // what the service says
    std::optional<bool> isWanted;     // what the preference says
    Store store;
  };

  explicit QVStatusCommand(const QVToolContext& context) : context_(context) {}
  Findings find(const Options& options) const;
  Store findStore() const;
  QVValue json(const Findings& findings) const;
  void show(const Findings& findings) const;
  void showLine(const char* title, const std::string& text,
                QVToolOutput::Style style = QVToolOutput::Style::plain) const;

  const QVToolContext& context_;
};
