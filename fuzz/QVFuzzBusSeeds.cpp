#include "fuzz/QVFuzzBusSeeds.h"

#include "tests/support/QVTestMessage.h"

#include <string_view>

using namespace std::string_view_literals;

namespace {

constexpr auto kLetIn = "\0AUTH EXTERNAL 31303030\r\nBEGIN\r\n"sv;
constexpr auto kLetInByQuestions =
    "\0AUTH\r\nAUTH EXTERNAL\r\nDATA\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n"sv;

std::string payload(char order) {
  QVTestWire wire(order);
  wire.array(8, [](QVTestWire& entries) {
    entries.entry("y", "y").u8(1);
    entries.entry("b", "b").u32(1);
    entries.entry("n", "n").u16(2);
    entries.entry("i", "i").u32(3);
    entries.entry("t", "t").u64(UINT64_MAX);
    entries.entry("d", "d").real(0.5);
    entries.entry("s", "s").string("text");
    entries.entry("o", "o").string("/a/b");
    entries.entry("g", "g").signature("a{sv}");
    entries.entry("v", "v").signature("v").signature("y").u8(1);
    entries.entry("as", "as").array(4, [](QVTestWire& items) { items.string("a").string("b"); });
    entries.entry("st", "(sua(y))").align(8).string("x").u32(1).array(8, [](QVTestWire& items) {
      items.u8(1).align(8).u8(2);
    });
    entries.entry("m", "a{ua{sv}}").array(8, [](QVTestWire& items) {
      items.align(8).u32(7).array(8, [](QVTestWire& inner) { inner.entry("k", "x").i64(-1); });
    });
  });
  return wire.bytes;
}

QVTestMessage sendMessage(char order, const std::string& dictionary) {
  QVTestWire body(order);
  body.raw(dictionary).u32(1).u16(2).u32(0).array(8, [](QVTestWire& items) { items.i64(5); });
  return {.order = order, .member = "SendMessage", .signature = "a{sv}uqbax", .body = body.bytes};
}

std::string operations(char order) {
  std::string bytes;
  for (const auto* member :
       {"CreateReportingSession", "StartReportingSessionForID", "GetServiceNameForReporterID",
        "ReporterIDValid", "StopReportingSessionForID", "DestroyReportingSession"}) {
    bytes += QVTestCall(member, 5, 1, order);
  }
  bytes += QVTestMessage{.order = order, .member = "GetAllReporters"}.bytes();
  bytes += QVTestMessage{.order = order, .member = "KillService"}.bytes();
  bytes += QVTestMessage{.order = order,
                         .member = "SetServiceType",
                         .signature = "qx",
                         .body = QVTestWire(order).u16(3).i64(5).bytes}
               .bytes();
  bytes += QVTestMessage{.order = order,
                         .member = "SetConfiguration",
                         .signature = "a{sv}x",
                         .body = QVTestWire(order).raw(payload(order)).i64(5).bytes}
               .bytes();
  return bytes;
}

std::string standard() {
  std::string bytes;
  for (const auto* member : {"Hello", "ListNames"}) {
    bytes += QVTestMessage{.path = "/org/freedesktop/DBus",
                           .interface = "org.freedesktop.DBus",
                           .member = member,
                           .destination = "org.freedesktop.DBus"}
                 .bytes();
  }
  bytes += QVTestMessage{.path = "/", .interface = "", .member = "Introspect"}.bytes();
  bytes += QVTestMessage{.interface = "org.freedesktop.DBus.Properties",
                         .member = "GetAll",
                         .signature = "s",
                         .body = QVTestWire().string("").bytes}
               .bytes();
  bytes +=
      QVTestMessage{.type = 4, .signature = "s", .body = QVTestWire().string("x").bytes}.bytes();
  bytes += QVTestMessage{.type = 2, .moreFields = QVTestWire().u8(5).signature("u").u32(3).bytes}
               .bytes();
  return bytes;
}

// With the byte before it that says how to cut it.
std::string seed(uint8_t pieceSize, std::string_view letIn, const std::string& messages) {
  return std::string(1, static_cast<char>(pieceSize)).append(letIn).append(messages);
}

}  // namespace

std::vector<QVFuzzBusSeed> QVFuzzBusSeeds() {
  return {
      {"operations-little", seed(255, kLetIn, operations('l')), {10, 10, 1, 10}},
      {"operations-big", seed(6, kLetIn, operations('B')), {10, 10, 1, 10}},
      {"message-little", seed(0, kLetIn, sendMessage('l', payload('l')).bytes()), {1, 1, 1, 1}},
      {"message-big",
       seed(40, kLetInByQuestions, sendMessage('B', payload('B')).bytes()),
       {1, 1, 1, 1}},
      {"standard", seed(99, kLetInByQuestions, standard()), {6, 6, 0, 0}},
      {"wrong-signature",
       seed(
           9, kLetIn,
           QVTestMessage{.signature = "xa{sv}", .body = QVTestWire().i64(0).raw(payload('l')).bytes}
               .bytes()),
       {1, 1, 0, 0}},
  };
}
