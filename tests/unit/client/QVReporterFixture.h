#pragma once

#include "client/QVReporter.h"
#include "tests/support/QVTemporaryRoot.h"
#include "tests/unit/client/QVScriptedService.h"

#include <condition_variable>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include <gtest/gtest.h>

// A reporter, and a service that the test plays: it takes connections at a socket in a directory of
// its own, and answers what the test lets it answer.
//
// Threads: the test's; drops are told of on the reporter's.
class QVReporterFixture : public testing::Test {
 protected:
  using Call = QVScriptedService::Call;
  using Code = QVClientError::Code;
  using Strings = std::vector<std::string>;

  static constexpr std::chrono::milliseconds kPatience{20'000};
  static constexpr QVClientCategory kPlayback{QVClientComponent::session, QVClientKind::playback};

  // Listens from the beginning.
  QVReporterFixture();
  ~QVReporterFixture() override;

  // Pauses as short as can be, ends without waiting.
  QVReporterOptions options();
  void open() { open(options()); }
  void open(QVReporterOptions options);
  std::unique_ptr<QVReporterSession> openSession(int64_t reporterID);
  // Sends {"n": number}.
  Code send(QVReporterSession& session, int64_t number);

  // Nobody listens any more, or again.
  void stopListening();
  void listen();
  // The reporter's next connection, let in.
  std::unique_ptr<QVScriptedService> accept();

  // The next call as text, answered as the service does: "create 7", "type 7 2", "configure 7",
  // "start 7", "valid 7", "send 7 3" (its number), "send * 3", "stop 7", "destroy 7".
  static std::string serve(QVScriptedService& service);
  static Strings serve(QVScriptedService& service, std::size_t count);
  // The same of a call, without an answer.
  static std::string describe(const Call& call);
  static void answer(QVScriptedService& service, const Call& call);

  // Waits until the reporter says that it is without its service; where nobody listens, it stays
  // so.
  void awaitConnectionError() const;
  // The drops that the reporter told of, in all; waits until there are so many.
  QVDropCounts awaitDrops(uint64_t count);
  // The same for one reason; answers how many.
  uint64_t awaitDrops(QVDropReason reason, uint64_t count);
  // Switches reporting; the latter posts the service's notification, too.
  void configure(bool on);
  void switchReporting(bool on);
  void post();

  const QVTemporaryRoot root_;
  int listener_ = -1;
  std::unique_ptr<QVReporter> reporter_;

 private:
  std::mutex mutex_;
  std::condition_variable changed_;
  QVDropCounts drops_;
};
