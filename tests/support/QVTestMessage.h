#pragma once

#include "tests/support/QVTestWire.h"

#include <cstdint>
#include <string>
#include <string_view>

// A message for tests: what a call of the service looks like unless told otherwise.
struct QVTestMessage {
  char order = 'l';
  uint8_t type = 1;
  uint8_t flags = 0;
  uint8_t version = 1;
  uint32_t serial = 1;
  std::string path = "/net/quillon/quietvox/ReportingService";
  std::string interface = "net.quillon.quietvox.ReportingService";
  std::string member = "CreateReportingSession";
  std::string destination{};
  std::string signature{};
  std::string body{};
  std::string moreFields{};  // marshalled; begins at a multiple of 8

  std::string bytes() const {
    QVTestWire wire(order);
    wire.u8(static_cast<uint8_t>(order)).u8(type).u8(flags).u8(version);
    wire.u32(static_cast<uint32_t>(body.size())).u32(serial);
    wire.array(8, [this](QVTestWire& fields) {
      if (!path.empty()) fields.field(1, "o", path);
      if (!interface.empty()) fields.field(2, "s", interface);
      if (!member.empty()) fields.field(3, "s", member);
      if (!destination.empty()) fields.field(6, "s", destination);
      if (!signature.empty()) fields.field(8, "g", signature);
      if (!moreFields.empty()) fields.align(8).raw(moreFields);
    });
    return wire.align(8).bytes + body;
  }
};

// A call of an operation that takes a reporter ID.
inline std::string QVTestCall(std::string_view member, int64_t reporterID, uint32_t serial = 1,
                              char order = 'l', uint8_t flags = 0) {
  return QVTestMessage{.order = order,
                       .flags = flags,
                       .serial = serial,
                       .member = std::string(member),
                       .signature = "x",
                       .body = QVTestWire(order).i64(reporterID).bytes}
      .bytes();
}
