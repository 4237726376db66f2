#pragma once

#include "tools/qvctl/QVToolContext.h"
#include "tools/qvctl/QVToolFailure.h"

#include <functional>
#include <memory>
#include <string>

// What qvctl is asked for: its commands and their options, and what they are called. The parser's
// library is behind the .cpp files of this class alone.
//
// Threads: one.
class QVCommandLine {
 public:
  // For the sources of this class.
  struct State;
  using Action = std::function<QVToolStatus(const QVToolContext& context)>;

  QVCommandLine();
  ~QVCommandLine();
  QVCommandLine(const QVCommandLine&) = delete;
  QVCommandLine& operator=(const QVCommandLine&) = delete;

  // Reads the arguments; false where that is all: help was asked for, or they are wrong, which has
  // been said. `status` is how qvctl ends then.
  bool parse(int argc, const char* const* argv, QVToolStatus& status);

  // What was asked for.
  bool wantsJSON() const;
  QVToolPlaces places() const;
  QVToolStatus run(const QVToolContext& context) const;

 private:
  void addInspection();
  void addSummary();
  void addSessions();
  void addSettings();

  const std::unique_ptr<State> state_;
};
