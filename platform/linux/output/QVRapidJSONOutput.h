#pragma once

#include "platform/QVJSONOutput.h"

// JSON text by RapidJSON's writers, handed on in pieces of 64 KiB.
//
// A value that JSON has no word for is named in the error by the innermost key that it lies under.
//
// Threads: any, at once.
class QVRapidJSONOutput final : public QVJSONOutput {
 public:
  std::unique_ptr<QVJSONArrayStream> makeArrayStream(Sink sink) override;
};
