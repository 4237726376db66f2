#pragma once

#include "client/QVClientPayload.h"
#include "client/QVClientVocabulary.h"
#include "platform/linux/QVDescriptor.h"
#include "tools/qvctl/QVServiceConnection.h"

#include <atomic>
#include <chrono>
#include <cstdint>
#include <memory>
#include <string>

// The end of a session that somebody waits for, who wants to hear of something else: a last message
// of the type Stop and the session's stop. Both are sent at once, so that they are reported, too,
// where the answers come late; the answers are waited for for a short time in all.
//
// Threads: made and asked on one; the answers come on the client library's.
class QVSessionEnd {
 public:
  struct Patience {
    // A signal that ended a command may reach this process a moment later than that.
    std::chrono::milliseconds undisturbed{250};
    // The service answers in microseconds. What takes longer is not worth anybody's waiting.
    std::chrono::milliseconds limit{3000};
  };

  // Sends both. Failures: QVToolFailure, where they cannot be sent.
  QVSessionEnd(QVServiceConnection& service, int64_t reporterID, const QVClientPayload& message,
               QVClientCategory category);

  // Waits for the answers, or until `interruption` is readable. What has to be said of it; empty
  // where all went well.
  std::string await(int interruption, Patience patience) const;
  std::string await(int interruption) const { return await(interruption, Patience{}); }

 private:
  struct Answers {
    const QVDescriptor over;     // readable when both have come
    std::string problem{};       // the first; the library's thread's until both have come
    std::atomic<bool> isOver{};  // they have
  };
  static void note(Answers& answers, const QVClientError& error);

  // The library's, too, until both have come.
  const std::shared_ptr<Answers> answers_;
};
