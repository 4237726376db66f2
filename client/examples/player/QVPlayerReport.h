#pragma once

#include "client/QVClient.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>

struct QVPlayerOptions;

// What is played, as it is configured for a session.
struct QVPlayerStream {
  unsigned rate = 0;
  unsigned channels = 0;
  std::size_t bufferFrames = 0;
  std::size_t periodFrames = 0;
  std::string device;
  std::string format;
};

// How far it is.
struct QVPlayerProgress {
  int64_t frames = 0;
  double position = 0;  // seconds
  std::size_t bufferedFrames = 0;
  unsigned underruns = 0;
  int64_t processingMicroseconds = 0;  // since the last progress
  double engineSeconds = 0;            // since the last progress
};

// Reports what the player does: a session for each file. Nothing here stops the playing: when the
// service goes away, or takes no messages, that is said once, and the rest is counted.
//
// Threads: the player's; replies count on the client library's thread.
class QVPlayerReport {
 public:
  // Null where the service cannot be reached; `problem` says why.
  static std::unique_ptr<QVPlayerReport> connect(const QVPlayerOptions& options,
                                                 std::string& problem);

  void begin(const QVPlayerStream& stream);
  void playbackStarted();
  void progressed(const QVPlayerProgress& progress);
  void volumeChanged(int percent);
  void routeChanged(const std::string& route);
  // `completely`: the file was played to its end.
  void playbackStopped(const QVPlayerProgress& progress, bool completely);
  void end();

  // Of the session.
  unsigned messagesAccepted() const { return accepted_; }
  unsigned messagesLost() const { return lost_; }

 private:
  explicit QVPlayerReport(const QVPlayerOptions& options) : options_(options) {}
  QVClientPayload& message();
  void send(QVClientCategory category, QVClientMessageType type);
  void note(const QVClientError& error);
  void sayOnce(const std::string& text);

  const QVPlayerOptions& options_;
  QVClientPayload payload_;  // one for all messages: its memory stays
  std::atomic<unsigned> accepted_{0};
  std::atomic<unsigned> lost_{0};
  std::atomic<bool> said_{false};
  std::unique_ptr<QVClient> client_;  // last: its replies use the rest
};
