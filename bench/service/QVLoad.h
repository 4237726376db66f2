#pragma once

#include "client/QVClient.h"
#include "client/QVClientPayload.h"

#include <cstdint>
#include <deque>
#include <memory>
#include <string>
#include <vector>

// A reporting client that a benchmark drives from its own thread: sends ten-entry messages of about
// 250 bytes of content, a bounded number of them unanswered at a time. Throws where the service
// refuses or goes away.
//
// Threads: one.
class QVLoad {
 public:
  // Connects to the service at `socketPath`.
  explicit QVLoad(const std::string& socketPath);
  // Over a connected socket.
  explicit QVLoad(int descriptor);
  // Other objects hold references into it.
  QVLoad(const QVLoad&) = delete;
  QVLoad& operator=(const QVLoad&) = delete;

  // Makes and starts sessions with these reporter IDs; messages go to them in turn. Without any,
  // messages go to an empty list.
  void startSessions(const std::vector<int64_t>& reporterIDs);
  void stopSessions();

  // Sends `count` messages, `window` of them unanswered at a time; returns after the last answer.
  void send(int64_t count, int64_t window);
  // The same for several clients at once, each sending `count`.
  static void send(const std::vector<std::unique_ptr<QVLoad>>& loads, int64_t count,
                   int64_t window);

  QVClient& client() { return *client_; }
  // The message that is sent.
  static QVClientPayload makeMessage();

 private:
  explicit QVLoad(QVClientResult<std::unique_ptr<QVClient>> client);
  // Sends as much as the window allows; true until everything is answered.
  bool pump(int64_t count, int64_t window);
  void sendOne();

  std::unique_ptr<QVClient> client_;
  QVClientPayload message_ = makeMessage();
  std::vector<int64_t> reporterIDs_;
  int64_t sent_ = 0;
  int64_t answered_ = 0;
  int64_t errors_ = 0;
};
