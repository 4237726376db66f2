#pragma once

#include "tools/qvctl/QVToolOutput.h"
#include "tools/qvctl/QVToolPlaces.h"

// What every command is given: where the service is, and where its text goes. Made by the command
// line, outlives the command.
struct QVToolContext {
  QVToolPlaces places;
  QVToolOutput& output;
  // Whether qvctl was started with SIGPIPE ignored: programs that it runs begin with that, too.
  bool ignoresPipes = false;
};
