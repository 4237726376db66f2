#include "bench/service/QVSdBusBaseline.h"

#include <stdexcept>

#include <sys/socket.h>
#include <sys/un.h>
#include <systemd/sd-bus.h>
#include <systemd/sd-id128.h>

namespace {

constexpr const char* kPath = "/net/quillon/quietvox/ReportingService";
constexpr const char* kInterface = "net.quillon.quietvox.ReportingService";

// Answers the outcome of a library call, or throws with what failed.
int check(int result, const char* what) {
  if (result < 0) throw std::runtime_error(std::string(what) + ": error " + std::to_string(result));
  return result;
}

// Called by the library, so they answer errors and throw nothing.

int readEntry(sd_bus_message* message) {
  const char* key = nullptr;
  char type = 0;
  const char* contents = nullptr;
  union {
    const char* text;
    int64_t integer;
    double real;
  } value;
  int result = sd_bus_message_read_basic(message, 's', &key);
  if (result >= 0) result = sd_bus_message_peek_type(message, &type, &contents);
  if (result >= 0) result = sd_bus_message_enter_container(message, 'v', contents);
  if (result >= 0) result = sd_bus_message_read_basic(message, contents[0], &value);
  if (result >= 0) result = sd_bus_message_exit_container(message);
  return result >= 0 ? sd_bus_message_exit_container(message) : result;
}

int handleSendMessage(sd_bus_message* message, void*, sd_bus_error*) {
  int result = sd_bus_message_enter_container(message, 'a', "{sv}");
  while (result >= 0 && (result = sd_bus_message_enter_container(message, 'e', "sv")) > 0) {
    result = readEntry(message);
  }
  if (result >= 0) result = sd_bus_message_exit_container(message);
  uint32_t category = 0;
  uint16_t type = 0;
  int everySession = 0;
  if (result >= 0) {
    result = sd_bus_message_read(message, "uqb", &category, &type, &everySession);
  }
  const void* reporterIDs = nullptr;
  size_t size = 0;
  if (result >= 0) result = sd_bus_message_read_array(message, 'x', &reporterIDs, &size);
  return result >= 0 ? sd_bus_reply_method_return(message, "") : result;
}

const sd_bus_vtable kTable[] = {
    SD_BUS_VTABLE_START(0),
    SD_BUS_METHOD("SendMessage", "a{sv}uqbax", "", handleSendMessage, SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_VTABLE_END};

sd_bus_message* makeCall(sd_bus* bus) {
  sd_bus_message* call = nullptr;
  check(sd_bus_message_new_method_call(bus, &call, nullptr, kPath, kInterface, "SendMessage"),
        "new call");
  check(sd_bus_message_append(call, "a{sv}uqbax", 10, "buffer_fill", "d", 0.8125, "codec", "s",
                              "pcm_s16le_interleaved_48k_stereo", "frames", "x", int64_t{48000},
                              "position_ms", "x", int64_t{123000}, "processing_time_us", "d", 412.5,
                              "qvreporting_timestamp", "d", 1763671234.25, "route", "s",
                              "net.quillon.output.speaker.builtin", "sample_rate", "x",
                              int64_t{48000}, "volume", "d", 0.75, "xruns", "x", int64_t{0},
                              uint32_t{0x08000003}, 0, 0, 0),
        "append");
  return call;
}

struct Answers {
  int64_t all = 0;
  int64_t errors = 0;
};

int countAnswer(sd_bus_message* message, void* answers, sd_bus_error*) {
  auto& counts = *static_cast<Answers*>(answers);
  ++counts.all;
  if (sd_bus_message_is_method_error(message, nullptr) > 0) ++counts.errors;
  return 0;
}

}  // namespace

void QVSdBusBaseline::serve(int descriptor) {
  sd_bus* bus = nullptr;
  sd_id128_t server;
  check(sd_id128_randomize(&server), "server id");
  check(sd_bus_new(&bus), "new bus");
  check(sd_bus_set_fd(bus, descriptor, descriptor), "descriptor");
  check(sd_bus_set_server(bus, 1, server), "server");
  check(sd_bus_set_anonymous(bus, 1), "anonymous");
  check(sd_bus_add_object_vtable(bus, nullptr, kPath, kInterface, kTable, nullptr), "object");
  check(sd_bus_start(bus), "start");
  for (;;) {
    const int processed = sd_bus_process(bus, nullptr);
    if (processed < 0) break;  // the peer is gone
    if (processed == 0 && sd_bus_wait(bus, UINT64_MAX) < 0) break;
  }
  sd_bus_close_unref(bus);
}

void QVSdBusBaseline::send(const std::string& socketPath, int64_t count, int64_t window) {
  const int descriptor = check(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0), "socket");
  sockaddr_un address{.sun_family = AF_UNIX, .sun_path = {}};
  socketPath.copy(address.sun_path, sizeof address.sun_path - 1);
  check(::connect(descriptor, reinterpret_cast<const sockaddr*>(&address), sizeof address),
        "connect");
  send(descriptor, count, window);
}

void QVSdBusBaseline::send(int descriptor, int64_t count, int64_t window) {
  sd_bus* bus = nullptr;
  check(sd_bus_new(&bus), "new bus");
  check(sd_bus_set_fd(bus, descriptor, descriptor), "descriptor");
  check(sd_bus_start(bus), "start");
  Answers answers;
  for (int64_t sent = 0; answers.all < count;) {
    while (sent < count && sent - answers.all < window) {
      sd_bus_message* call = makeCall(bus);
      check(sd_bus_call_async(bus, nullptr, call, countAnswer, &answers, UINT64_MAX), "call");
      sd_bus_message_unref(call);
      ++sent;
    }
    const int processed = check(sd_bus_process(bus, nullptr), "process");
    if (processed == 0) check(sd_bus_wait(bus, UINT64_MAX), "wait");
  }
  sd_bus_close_unref(bus);
  if (answers.errors != 0) throw std::runtime_error("the service answered with an error");
}
