#pragma once

#include <cstddef>
#include <cstdint>

// Numbers and limits of the bus wire protocol, as server and client library share them.
//
// Everything that comes in over a socket is hostile until checked: order, ranges, sizes, types,
// texts. A peer's identity comes from the kernel, never from what it writes. What breaks a rule of
// the protocol costs its sender the connection and nobody else anything.

enum class QVBusMessageType : uint8_t {
  invalid = 0,
  methodCall = 1,
  methodReturn = 2,
  error = 3,
  signal = 4
  // Higher ones may be defined some day; such messages are checked and ignored.
};

// Flags of a message. Unknown ones are ignored.
inline constexpr uint8_t kBusNoReplyExpected = 0x1;

// Codes of header fields.
enum class QVBusField : uint8_t {
  path = 1,
  interface = 2,
  member = 3,
  errorName = 4,
  replySerial = 5,
  destination = 6,
  sender = 7,
  signature = 8,
  unixFDs = 9
};

inline constexpr uint8_t kBusProtocolVersion = 1;

// Bytes before the header's fields: byte order, type, flags, version, body length, serial, length
// of the fields.
inline constexpr std::size_t kBusFixedHeaderBytes = 16;

// Bytes of header and body together. The protocol allows 128 MiB; statistics need a few hundred
// bytes, and a peer must not make the service hold more than this for one message.
inline constexpr std::size_t kBusMaximumMessageBytes = std::size_t{8} << 20;

// Bytes of one array's contents; the protocol's own limit.
inline constexpr std::size_t kBusMaximumArrayBytes = std::size_t{64} << 20;

// Characters of a signature and of a name; the protocol's own limits.
inline constexpr std::size_t kBusMaximumSignatureLength = 255;
inline constexpr std::size_t kBusMaximumNameLength = 255;

// Containers within each other: arrays and structs of one signature, and containers of any kind,
// variants included, of one message; the protocol's own limits. They also bound our recursion.
inline constexpr unsigned kBusMaximumArrayDepth = 32;
inline constexpr unsigned kBusMaximumStructDepth = 32;
inline constexpr unsigned kBusMaximumDepth = 64;
