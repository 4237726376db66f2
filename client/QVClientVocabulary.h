#pragma once

#include "client/QVClientExport.h"

#include <cstdint>
#include <optional>
#include <string_view>

// The words of the service's interface: what a session is for, what a message is about. Values and
// names are the service's; any other value of the same width may be sent as well
// (`static_cast<QVClientServiceType>(4711)`), the service then has no name for it.
//
// Pure; any thread.

// What a session reports on.
enum class QVClientServiceType : uint16_t {
  generic = 0,
  voxa = 1,  // the voice assistant
  telephony = 2,
  haptics = 3,
  alarms = 4,
  standalone = 5,
  soundautoconfig = 6,
  longformaudio = 7,
  nonlongformaudio = 8,
  audiodeviceusage = 9,
  alerts = 10,
  test = 11,
  apiusage = 12,
  unknown = 65535  // never set, or no such session
};

// "telephony"; empty for a value without a name.
QV_CLIENT_API std::string_view QVClientNameOf(QVClientServiceType serviceType) noexcept;
// The service type of that name, or of that number in decimal; nothing where it is neither.
QV_CLIENT_API std::optional<QVClientServiceType> QVClientServiceTypeNamed(
    std::string_view name) noexcept;

// The part of the audio stack that a message is about: the high half of its category.
enum class QVClientComponent : uint32_t {
  none = 0,
  session = 0x08000000,
  dsp = 0x10000000,
  hal = 0x20000000,
  routing = 0x40000000,
  toolbox = 0x80000000
};

// What a message is about: the low half of its category.
enum class QVClientKind : uint16_t {
  undefined = 0,
  generic = 1,
  record = 2,
  playback = 3,
  playbackAndRecord = 4,
  setup = 5,
  clientRequest = 6,
  routeChange = 7,
  error = 8,
  tallying = 9,
  performance = 10,
  volume = 11
};

// A message's category: component and kind, or any word of 32 bits.
struct QVClientCategory {
  uint32_t word = 0;

  constexpr QVClientCategory(QVClientComponent component, QVClientKind kind) noexcept
      : word(static_cast<uint32_t>(component) | static_cast<uint32_t>(kind)) {}
  constexpr QVClientCategory(QVClientKind kind) noexcept : word(static_cast<uint32_t>(kind)) {}
  constexpr explicit QVClientCategory(uint32_t anyWord) noexcept : word(anyWord) {}
};

enum class QVClientMessageType : uint16_t {
  generic = 0,
  start = 1,
  stop = 2,
  setup = 3,
  error = 4,
  issueDetector = 5,
  unknown = 65535
};
