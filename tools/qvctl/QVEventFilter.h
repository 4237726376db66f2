#pragma once

#include "tools/qvctl/QVNames.h"
#include "tools/qvctl/QVStoredEvent.h"

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

// Which events are wanted. Of several values of one property one has to hold, of several properties
// all. An event that lacks a property is not wanted where it is asked for: an analytics event has
// no session. A value; any thread.
class QVEventFilter {
 public:
  // As the command line has them. Failures: QVToolFailure, wrongUsage.
  struct Words {
    std::vector<std::string> kinds = {};       // empty: all
    std::vector<std::string> sessions = {};    // reporter IDs
    std::vector<std::string> services = {};    // names or numbers
    std::vector<std::string> categories = {};  // "Playback", "Session", "Session.Playback", numbers
    std::vector<std::string> types = {};
    std::vector<std::string> names = {};  // patterns with * and ?
    std::optional<std::string> since = {};
    std::optional<std::string> until = {};
  };

  QVEventFilter();
  QVEventFilter(const Words& words, int64_t now);

  bool wants(QVStoredEvent::Kind kind) const { return kinds_[static_cast<std::size_t>(kind)]; }
  // Looks at everything but the payload.
  bool wants(const QVStoredEvent& event) const;

  std::optional<int64_t> since() const { return since_; }

 private:
  bool wantsCategory(const QVStoredEvent& event) const;

  std::array<bool, QVStoredEvent::kKinds> kinds_{};
  std::vector<int64_t> sessions_;
  std::vector<std::string> services_;  // as the store has them
  std::vector<QVCategoryPattern> categories_;
  std::vector<uint16_t> types_;
  std::vector<std::string> names_;
  std::optional<int64_t> since_;
  std::optional<int64_t> until_;
};
