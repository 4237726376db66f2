#pragma once

#include "tools/qvctl/QVSessionSetup.h"
#include "tools/qvctl/QVToolContext.h"
#include "tools/qvctl/QVToolFailure.h"

#include <cstdint>

// qvctl session create, start, stop, destroy: a session for scripts, step by step. What is created
// is kept by a process of its own (QVSessionKeeper). Any session can be started.
//
// Threads: one.
class QVSessionCommand {
 public:
  enum class Operation { create, start, stop, destroy };
  struct Options {
    Operation operation = Operation::create;
    int64_t reporterID = 0;  // but for create
    QVSessionSetup setup;    // for create
    bool start = false;      // the session that is created
  };

  static QVToolStatus run(const QVToolContext& context, const Options& options);

 private:
  static void create(const QVToolContext& context, const Options& options);
  static void start(const QVToolContext& context, int64_t reporterID);
};
