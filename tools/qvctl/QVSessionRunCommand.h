#pragma once

#include "tools/qvctl/QVSessionSetup.h"
#include "tools/qvctl/QVToolContext.h"
#include "tools/qvctl/QVToolFailure.h"

#include <memory>
#include <string>
#include <vector>

// qvctl session run: runs a command and reports its life as a session. A message of the type Start
// says which program it is; one of the type Stop how it ended and what it took. The command has
// qvctl's standard input, output and error and its terminal; signals that qvctl is sent are passed
// on; the session's ID is in its environment, for `qvctl send`. It begins with the signals ignored
// and blocked that qvctl was started with.
//
// The exit status is the command's: 128 and the signal's number for one that a signal ended, 127
// where there is no such program, 126 where it cannot be run. When it has ended, the service is
// waited for a little (QVSessionEnd), and no signal is passed on any more.
//
// Threads: one; the client library has its own.
class QVSessionRunCommand {
 public:
  struct Options {
    QVSessionSetup setup;
    std::string category = "Session.Generic";
    bool anyway = false;  // run it, too, where the service cannot be reached
    std::vector<std::string> command;
  };

  static QVToolStatus run(const QVToolContext& context, const Options& options);
};
