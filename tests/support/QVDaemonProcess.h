#pragma once

#include "tests/support/QVSubprocess.h"
#include "tests/support/QVTemporaryRoot.h"

#include <chrono>
#include <cstddef>
#include <filesystem>
#include <map>
#include <optional>
#include <string>
#include <vector>

// The real service, running in a temporary root, its log in a file there.
//
// Threads: one at a time.
class QVDaemonProcess {
 public:
  struct Options {
    int inheritedSocket = -1;  // listening; handed over as a service manager does
    std::map<std::string, std::string> environment = {};  // over what a service manager gives
    std::vector<std::string> wrapper = {};  // a program that turns itself into the service
  };

  // Starts the service and waits until it says that it is ready. Throws where it does not.
  QVDaemonProcess(const QVTemporaryRoot& root, const Options& options);
  explicit QVDaemonProcess(const QVTemporaryRoot& root, int inheritedSocket = -1)
      : QVDaemonProcess(root, Options{.inheritedSocket = inheritedSocket}) {}
  ~QVDaemonProcess();
  QVDaemonProcess(const QVDaemonProcess&) = delete;
  QVDaemonProcess& operator=(const QVDaemonProcess&) = delete;

  // The environment that a service manager would give the service.
  static std::map<std::string, std::string> environment(const QVTemporaryRoot& root);
  // The service's program, beside the running one.
  static std::filesystem::path program();
  // Another program of the build, by its name.
  static std::filesystem::path program(const std::string& name);

  pid_t pid() const { return process_.pid(); }
  // What the service told its manager next, in lines such as "STOPPING=1"; empty where nothing
  // comes within a minute.
  std::string nextNotification() const;
  std::string log() const;

  // Asks for an orderly end and waits for it; the exit status.
  std::optional<QVSubprocess::Status> terminate();
  std::optional<QVSubprocess::Status> wait(
      std::chrono::milliseconds limit = std::chrono::seconds(60)) {
    return process_.wait(limit);
  }
  void signal(int number) const { process_.signal(number); }

  // Processor time that the service has used so far.
  std::chrono::nanoseconds processorTime() const;
  // A number of a line such as "VmRSS:   1234 kB" of /proc/PID/status or "write_bytes: 5" of
  // /proc/PID/io.
  long statusNumber(const std::string& file, const std::string& key) const;
  std::size_t openDescriptors() const;

 private:
  static int makeReadinessSocket(const QVTemporaryRoot& root);

  const QVTemporaryRoot& root_;
  int readiness_;
  QVSubprocess process_;
};
