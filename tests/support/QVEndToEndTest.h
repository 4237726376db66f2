#pragma once

#include "tests/support/QVDaemonProcess.h"
#include "tests/support/QVPeerClient.h"
#include "tests/support/QVServiceLog.h"
#include "tests/support/QVStoreReader.h"
#include "tests/support/QVTemporaryRoot.h"

#include <optional>
#include <string>
#include <vector>

#include <gtest/gtest.h>

// Whether a process's memory says something about the service: sanitizers keep freed memory.
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
inline constexpr bool kMemoryTells = false;
#else
inline constexpr bool kMemoryTells = true;
#endif

// The real service in a temporary root, started when a test first asks for it.
//
// Threads: the test's.
class QVEndToEndTest : public ::testing::Test {
 protected:
  QVDaemonProcess& service() { return service_ ? *service_ : startService({}); }
  QVDaemonProcess& startService(const QVDaemonProcess::Options& options);
  // Another service in the same root, once the first one has ended.
  void forgetService() { service_.reset(); }

  // A client process that is let in.
  QVPeerClient connectClient();
  QVRawPeer connectSilently();
  // Does the service still do what a client asks for?
  void expectServes(QVPeerClient& client);

  const QVServiceLog& log() const { return log_; }
  // Waits for a log line; fails the test where it does not come.
  void expectLogged(std::string_view text, std::size_t count = 1);

  // Ends the service in good order; everything that it was sent is in its store then.
  void endService();
  QVStoreReader store() const { return QVStoreReader(root_.store()); }
  void expectStored(const std::string& query, std::size_t count);

  // The service's address, as D-Bus tools take it.
  std::string address() const { return "unix:path=" + root_.socket().string(); }

  QVTemporaryRoot root_;
  std::optional<QVDaemonProcess> service_;
  const QVServiceLog log_{root_.log()};
};
