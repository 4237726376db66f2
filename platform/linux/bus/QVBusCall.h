#pragma once

#include "platform/QVReportingServiceProtocol.h"
#include "platform/linux/bus/QVBusMessage.h"
#include "platform/linux/bus/QVBusReply.h"

#include <cstdint>
#include <string_view>

// One method call on its way to whoever answers it. Lives as long as its message's bytes.
struct QVBusCall {
  const QVBusMessage& message;
  QVBusReply reply;
  QVReportingServiceProtocol* object;  // null where the connection exports none
  QVMemoryCharge* charge;              // for what is decoded of the message
  uint64_t connectionNumber;
};

// Names of the standard errors.
inline constexpr std::string_view kBusErrorInvalidArgs = "org.freedesktop.DBus.Error.InvalidArgs";
inline constexpr std::string_view kBusErrorUnknownMethod =
    "org.freedesktop.DBus.Error.UnknownMethod";
inline constexpr std::string_view kBusErrorUnknownInterface =
    "org.freedesktop.DBus.Error.UnknownInterface";
inline constexpr std::string_view kBusErrorUnknownObject =
    "org.freedesktop.DBus.Error.UnknownObject";
inline constexpr std::string_view kBusErrorUnknownProperty =
    "org.freedesktop.DBus.Error.UnknownProperty";
inline constexpr std::string_view kBusErrorNameHasNoOwner =
    "org.freedesktop.DBus.Error.NameHasNoOwner";
inline constexpr std::string_view kBusErrorServiceUnknown =
    "org.freedesktop.DBus.Error.ServiceUnknown";
inline constexpr std::string_view kBusErrorFileNotFound = "org.freedesktop.DBus.Error.FileNotFound";

// Is the call's signature `expected`? If not, answers it with InvalidArgs, naming both. The call's
// own signature must have been checked.
bool QVBusExpectSignature(const QVBusCall& call, std::string_view expected);
