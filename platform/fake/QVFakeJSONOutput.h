#pragma once

#include "platform/QVJSONOutput.h"
#include "platform/fake/QVFakeMisuse.h"

#include <memory>
#include <string>
#include <vector>

// Writes JSON text for tests, simply: each element is made as a whole and handed to the sink.
//
// Threads: any, at once.
class QVFakeJSONOutput final : public QVJSONOutput {
 public:
  std::unique_ptr<QVJSONArrayStream> makeArrayStream(Sink sink) override;

  // Arrays that were added to or ended after their end or after a failure, and members that are not
  // in order.
  std::vector<std::string> takeMisuses() { return misuse_->take(); }

 private:
  class Stream;

  // Shared with the streams, which it may not outlive.
  const std::shared_ptr<QVFakeMisuse> misuse_ = std::make_shared<QVFakeMisuse>("QVFakeJSONOutput");
};
