#pragma once

#include "platform/QVText.h"

#include <atomic>
#include <cstdint>
#include <string>
#include <string_view>

// Levels, with the priorities of the system log.
enum class QVLogLevel : uint8_t { error = 3, standard = 5, info = 6, debug = 7 };

// A named scope of log lines. Owned by the log that registered it, lives as long as that.
struct QVLogScope {
  std::string name;
  uint32_t code = 0;
  std::string subsystem;
  std::atomic<bool> verbose{false};
};

// Where a line comes from: the function as the log names it ("-[QVReportingSession start]"), with
// file and line of the place that names it. Made implicitly from the function's name. (Not
// std::source_location, which clang 14 lacks.)
struct QVLogSite {
  const char* function;
  const char* file;  // as the compiler was given it, with directories
  uint32_t line;

  QVLogSite(const char* functionName, const char* fileName = __builtin_FILE(),
            uint32_t lineNumber = __builtin_LINE())
      : function(functionName), file(fileName), line(lineNumber) {}
};

// The service's log. Every line begins with "file:line:function: " (the file's name without
// directories); implementations add that prefix or hand its parts on as fields of their own.
//
// Threads: any, at once. write() never blocks: it hands the line to a bounded queue; a line that
// finds no room is counted and the count logged later. registerScope() may read a file. flush()
// waits until what was written has reached its destination, but only so long: a destination that
// takes nothing costs the lines, not the service.
class QVLog {
 public:
  // The verbosity at which debug lines are written.
  static constexpr int kVerbose = 5;
  // Bytes of one line's text; what is longer is cut.
  static constexpr std::size_t kMaximumTextBytes = std::size_t{16} << 10;

  virtual ~QVLog() = default;

  // Registers a scope and reads its verbose switch, the boolean `verboseKey` of the preferences
  // domain `domain`, once, now. Registering a name again answers the scope of the first time with
  // its switch read anew. `enabled` and `registration` belong to the facility's interface and are
  // kept with their fixed values (true, 31).
  virtual QVLogScope* registerScope(bool enabled, uint32_t code, std::string_view name,
                                    std::string_view domain, std::string_view verboseKey,
                                    int32_t registration) = 0;

  // Writes one line. A null scope is the default log.
  virtual void write(const QVLogScope* scope, QVLogLevel level, const QVLogSite& site,
                     std::string text) = 0;
  virtual void flush() = 0;

  // Are lines of this verbosity written for the scope? One relaxed load, to be asked before a
  // verbose line's arguments are built.
  static bool logEnabled(int verbosity, const QVLogScope* scope) noexcept {
    const auto& verbose = scope != nullptr ? scope->verbose : isDefaultVerbose_;
    return verbosity < kVerbose || verbose.load(std::memory_order_relaxed);
  }

  // Makes the default log (null) verbose, or not, as at first. It has no scope, and so no switch in
  // the preferences: the keys there are those of scopes. Nothing in the service calls it; a program
  // that makes a throttle of its own has that one's verbose lines written so.
  static void setDefaultVerbose(bool verbose) noexcept {
    isDefaultVerbose_.store(verbose, std::memory_order_relaxed);
  }

  // One line of the level's name; the text is that of the parts, one after the other.
  template <class... Parts>
  void error(const QVLogScope* scope, const QVLogSite& site, const Parts&... parts) {
    write(scope, QVLogLevel::error, site, QVText(parts...));
  }
  template <class... Parts>
  void standard(const QVLogScope* scope, const QVLogSite& site, const Parts&... parts) {
    write(scope, QVLogLevel::standard, site, QVText(parts...));
  }
  template <class... Parts>
  void info(const QVLogScope* scope, const QVLogSite& site, const Parts&... parts) {
    write(scope, QVLogLevel::info, site, QVText(parts...));
  }
  // Written only where the scope is verbose.
  template <class... Parts>
  void verbose(const QVLogScope* scope, const QVLogSite& site, const Parts&... parts) {
    if (logEnabled(kVerbose, scope)) write(scope, QVLogLevel::debug, site, QVText(parts...));
  }

 private:
  static inline std::atomic<bool> isDefaultVerbose_{false};
};
