#pragma once

#include "platform/QVValue.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

// Something that the event store keeps, as people and programs are shown it. A value.
struct QVStoredEvent {
  // In the order in which those of the same moment are shown.
  enum class Kind : uint8_t {
    start,      // a session was started: beacon_session
    message,    // beacon_message
    analytics,  // countwise_event
    energy,     // joulewell_event
    stop,       // a session's stop was flushed
    loss        // something is not there
  };
  static constexpr std::size_t kKinds = 6;

  Kind kind = Kind::message;
  int64_t id = 0;                  // of the row in its table
  int64_t time = 0;                // microseconds since 1970
  std::optional<int64_t> session;  // the reporter ID
  std::string service;             // the service type's name; "telephony"
  // Of a message the kind alone, the store keeps no more; of an analytics event the whole category.
  std::optional<uint32_t> category;
  std::optional<uint16_t> type;
  std::string name;     // of analytics and energy events; of a loss its cause
  std::string payload;  // JSON text; of a start the session's user information
  int64_t count = 0;    // of a loss

  std::string categoryText() const;
  std::string typeText() const;
  // One line of JSON is made of this.
  QVValue json() const;

  static std::string_view kindName(Kind kind);
  static std::optional<Kind> kindNamed(std::string_view name);
};
