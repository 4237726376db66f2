#pragma once

#include "tests/support/QVServiceLog.h"
#include "tests/support/QVSubprocess.h"

#include <cstddef>
#include <filesystem>
#include <stdexcept>
#include <string>
#include <string_view>

// What passes over a test's bus, in dbus-monitor's words. What has been seen has been handed to
// its receiver before anything that is sent from then on.
//
// Threads: one at a time.
class QVBusMonitor {
 public:
  // `file` lies in a directory of its own.
  QVBusMonitor(const std::string& busAddress, const std::filesystem::path& file)
      : busAddress_(busAddress),
        seen_(file),
        process_(
            {.arguments = {"dbus-monitor", "--address", busAddress}, .standardOutputFile = file}) {
    // It gives its name back as it begins to listen.
    if (!seen_.await("member=NameLost")) throw std::runtime_error("dbus-monitor does not listen");
  }

  // Has it passed that often, or does it within a minute?
  [[nodiscard]] bool await(std::string_view text, std::size_t count = 1) const {
    return seen_.await(text, count);
  }
  // How often it has passed until now: the monitor tells with a delay, but in the bus's order, so
  // that all is told once a signal sent now has been.
  [[nodiscard]] std::size_t count(std::string_view text) {
    const std::string mark = "Mark" + std::to_string(++marks_);
    const auto sent = QVSubprocess::run({"dbus-send", "--bus=" + busAddress_, "--type=signal",
                                         "/org/quietvox/tests", "org.quietvox.tests." + mark});
    if (sent.status != 0) throw std::runtime_error("dbus-send: " + sent.text);
    if (!seen_.await("member=" + mark)) throw std::runtime_error("the mark was not seen");
    return seen_.count(text);
  }

 private:
  const std::string busAddress_;
  const QVServiceLog seen_;
  QVSubprocess process_;
  std::size_t marks_ = 0;
};

inline constexpr std::string_view kClaimSeen = "member=ClaimAccelerometer";
inline constexpr std::string_view kReleaseSeen = "member=ReleaseAccelerometer";
// A claim was granted, and the value that is there is being read.
inline constexpr std::string_view kReadingSeen = "DBus.Properties; member=Get";
