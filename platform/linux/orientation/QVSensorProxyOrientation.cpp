#include "platform/linux/orientation/QVSensorProxyOrientation.h"

#include "platform/QVText.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <new>
#include <string_view>
#include <system_error>
#include <utility>

#include <systemd/sd-bus.h>

namespace {

using Clock = std::chrono::steady_clock;

constexpr const char* kService = "net.hadess.SensorProxy";
constexpr const char* kPath = "/net/hadess/SensorProxy";
constexpr const char* kInterface = "net.hadess.SensorProxy";
constexpr const char* kPropertiesInterface = "org.freedesktop.DBus.Properties";
constexpr const char* kProperty = "AccelerometerOrientation";
constexpr const char* kBus = "org.freedesktop.DBus";
constexpr const char* kUsualBus = "unix:path=/run/dbus/system_bus_socket";

constexpr const char* kOwnerMatch =
    "type='signal',sender='org.freedesktop.DBus',interface='org.freedesktop.DBus',"
    "member='NameOwnerChanged',arg0='net.hadess.SensorProxy'";
// The bus keeps what others broadcast away; what they send to the service alone still comes.
constexpr const char* kChangeMatch =
    "type='signal',sender='net.hadess.SensorProxy',path='/net/hadess/SensorProxy',"
    "interface='org.freedesktop.DBus.Properties',member='PropertiesChanged',"
    "arg0='net.hadess.SensorProxy'";

// Messages taken in one go: whoever floods the connection does not keep the thread from ending.
constexpr int kMostMessages = 64;

// The orientation that a variant names; undefined where it holds no string.
int32_t orientationIn(sd_bus_message* message) {
  const char* contents = nullptr;
  const char* word = nullptr;
  if (sd_bus_message_peek_type(message, nullptr, &contents) <= 0 || contents == nullptr ||
      std::string_view(contents) != "s" || sd_bus_message_read(message, "v", "s", &word) < 0) {
    return QVOrientation::kUndefined;
  }
  return QVOrientation::orientationNamed(word);
}

bool isFrom(sd_bus_message* message, std::string_view name) {
  const char* const sender = sd_bus_message_get_sender(message);
  return sender != nullptr && name == sender;
}

// Why a call failed; nothing where it did not.
std::optional<std::string> failureOf(sd_bus_message* reply) {
  if (sd_bus_message_is_method_error(reply, nullptr) <= 0) return std::nullopt;
  const sd_bus_error* const error = sd_bus_message_get_error(reply);
  return error->message == nullptr ? std::string(error->name)
                                   : QVText(error->name, ": ", error->message);
}

}  // namespace

struct QVSensorProxyOrientation::Dispatch {
  using Handler = void (QVSensorProxyOrientation::*)(sd_bus_message*);

  template <Handler Handle>
  static int to(sd_bus_message* message, void* self, sd_bus_error*) {
    auto& orientation = *static_cast<QVSensorProxyOrientation*>(self);
    try {
      (orientation.*Handle)(message);
    } catch (const std::bad_alloc&) {
      // Not through the library, which is C: the connection is given up once it has returned.
      orientation.isOutOfMemory_ = true;
    }
    return 0;
  }

  // Calls a member of one of the daemon's interfaces, in place of the call under way.
  template <Handler Handle, class... Arguments>
  static int call(QVSensorProxyOrientation& self, const char* of, const char* member, bool mayStart,
                  const char* types, Arguments... arguments) {
    self.forgetCall();
    sd_bus_message* call = nullptr;
    int result = sd_bus_message_new_method_call(self.bus_, &call, kService, kPath, of, member);
    if (result >= 0) result = sd_bus_message_set_auto_start(call, mayStart ? 1 : 0);
    if (result >= 0 && sizeof...(arguments) > 0) {
      result = sd_bus_message_append(call, types, arguments...);
    }
    if (result >= 0) {
      result = sd_bus_call_async(
          self.bus_, &self.call_, call, to<Handle>, &self,
          static_cast<uint64_t>(std::chrono::microseconds(self.options_.answerLimit).count()));
    }
    sd_bus_message_unref(call);
    return result;
  }
};

std::string QVSensorProxyOrientation::systemBusAddress() {
  const char* const address = secure_getenv("DBUS_SYSTEM_BUS_ADDRESS");
  return address == nullptr || *address == '\0' ? kUsualBus : address;
}

QVSensorProxyOrientation::QVSensorProxyOrientation(QVLog& log, QVSensorProxyOptions options,
                                                   QVOrientationRegistrations& registrations)
    : log_(log),
      options_(std::move(options)),
      registrations_(registrations),
      pause_(options_.firstRetry) {}

// The daemon takes a lost connection for a release as well: so the answer is not waited for.
QVSensorProxyOrientation::~QVSensorProxyOrientation() {
  release();
  close();
}

QVSensorProxyOrientation::Rest QVSensorProxyOrientation::rest() const {
  Rest rest;
  rest.end = retryAt_;
  if (bus_ == nullptr) return rest;
  const int events = sd_bus_get_events(bus_);
  uint64_t limit = 0;
  if (events < 0 || sd_bus_get_timeout(bus_, &limit) < 0) {
    rest.end = Clock::now();
    return rest;
  }
  rest.descriptor = sd_bus_get_fd(bus_);
  rest.events = static_cast<short>(events);
  // Both count the kernel's monotonic time.
  if (limit != UINT64_MAX) {
    const Clock::time_point end{std::chrono::microseconds(limit)};
    rest.end = std::min(rest.end.value_or(end), end);
  }
  return rest;
}

void QVSensorProxyOrientation::work() {
  followDemand();
  if (bus_ != nullptr) process();
  if (retryAt_ && Clock::now() >= *retryAt_) retry();
}

void QVSensorProxyOrientation::followDemand() {
  const auto period = registrations_.period();
  if (period == period_) return;
  const bool begins = period_ == QVOrientationRegistrations::kNoDemand;
  period_ = period;
  if (period == QVOrientationRegistrations::kNoDemand) {
    value_.reset();
    retryAt_.reset();
    release();
  } else if (begins) {
    pause_ = options_.firstRetry;
    // The daemon takes calls in their order: so a release under way is over before.
    retry();
  } else {
    tell();
  }
}

// Demand has begun, or the pause after a failure is over.
void QVSensorProxyOrientation::retry() {
  retryAt_.reset();
  if (const int result = bus_ == nullptr ? open() : claim(); result < 0) lose(result);
}

void QVSensorProxyOrientation::retryLater() {
  retryAt_ = Clock::now() + pause_;
  pause_ = std::min<std::chrono::milliseconds>(2 * pause_, kLongestRetry);
}

int QVSensorProxyOrientation::open() {
  int result = sd_bus_new(&bus_);
  if (result >= 0) result = sd_bus_set_address(bus_, options_.busAddress.c_str());
  if (result >= 0) result = sd_bus_set_bus_client(bus_, 1);
  if (result >= 0) result = sd_bus_start(bus_);
  if (result >= 0) {
    result =
        sd_bus_add_match_async(bus_, nullptr, kOwnerMatch,
                               Dispatch::to<&QVSensorProxyOrientation::handleOwner>, nullptr, this);
  }
  if (result >= 0) {
    result = sd_bus_add_match_async(bus_, nullptr, kChangeMatch,
                                    Dispatch::to<&QVSensorProxyOrientation::handleChange>, nullptr,
                                    this);
  }
  return result < 0 ? result : claim();
}

// Callbacks run here, between messages: nothing of the bus is at work then.
void QVSensorProxyOrientation::process() {
  int result = 1;
  for (int taken = 0; taken < kMostMessages && result > 0; ++taken) {
    result = sd_bus_process(bus_, nullptr);
    if (std::exchange(isOutOfMemory_, false)) result = -ENOMEM;
    tell();
  }
  if (result < 0) {
    lose(result);
  } else if (period_ == QVOrientationRegistrations::kNoDemand && call_ == nullptr) {
    close();
  }
}

void QVSensorProxyOrientation::close() {
  forgetCall();
  bus_ = sd_bus_close_unref(bus_);
  state_ = State::disconnected;
  owner_.clear();
}

void QVSensorProxyOrientation::lose(int error) {
  close();
  if (period_ == QVOrientationRegistrations::kNoDemand) return;
  // First, so that a want of memory in what follows does not end the attempts.
  retryLater();
  value_ = QVOrientation::kUndefined;
  note("the system bus: " + std::generic_category().message(-error));
  tell();
}

int QVSensorProxyOrientation::claim() {
  state_ = State::claiming;
  return Dispatch::call<&QVSensorProxyOrientation::finishClaim>(*this, kInterface,
                                                                "ClaimAccelerometer", true, "");
}

void QVSensorProxyOrientation::release() {
  switch (state_) {
    case State::claiming:
    case State::claimed:
      state_ = State::releasing;
      if (Dispatch::call<&QVSensorProxyOrientation::finishRelease>(
              *this, kInterface, "ReleaseAccelerometer", false, "") < 0) {
        close();
      }
      break;
    case State::unclaimed:
      close();
      break;
    case State::disconnected:
    case State::releasing:
      break;
  }
}

void QVSensorProxyOrientation::finishClaim(sd_bus_message* reply) {
  forgetCall();
  if (const auto failure = failureOf(reply)) {
    state_ = State::unclaimed;
    value_ = QVOrientation::kUndefined;
    // Where there is no daemon, and none that the bus could start, it tells when one appears.
    if (sd_bus_message_is_method_error(reply, SD_BUS_ERROR_SERVICE_UNKNOWN) <= 0) retryLater();
    note(*failure);
    return;
  }
  state_ = State::claimed;
  pause_ = options_.firstRetry;
  trouble_.clear();
  const char* const sender = sd_bus_message_get_sender(reply);
  owner_ = sender == nullptr ? "" : sender;
  // A connection that takes no more messages shows in the next step.
  static_cast<void>(Dispatch::call<&QVSensorProxyOrientation::finishReading>(
      *this, kPropertiesInterface, "Get", false, "ss", kInterface, kProperty));
}

void QVSensorProxyOrientation::finishReading(sd_bus_message* reply) {
  forgetCall();
  value_ = QVOrientation::kUndefined;
  if (const auto failure = failureOf(reply)) {
    note(*failure);
  } else {
    value_ = orientationIn(reply);
  }
}

void QVSensorProxyOrientation::finishRelease(sd_bus_message*) {
  forgetCall();
}

void QVSensorProxyOrientation::handleOwner(sd_bus_message* signal) {
  const char* name = nullptr;
  const char* before = nullptr;
  const char* now = nullptr;
  // Anybody may send the like to the service alone.
  if (!isFrom(signal, kBus)) return;
  if (state_ == State::releasing || sd_bus_message_read(signal, "sss", &name, &before, &now) < 0) {
    return;
  }
  if (*before != '\0') {
    forgetCall();
    owner_.clear();
    state_ = State::unclaimed;
    value_ = QVOrientation::kUndefined;
    retryAt_.reset();
  }
  // A claim under way is that which made the bus start the daemon.
  if (*now == '\0' || state_ != State::unclaimed) return;
  retryAt_.reset();
  pause_ = options_.firstRetry;
  if (claim() >= 0) return;
  state_ = State::unclaimed;
  retryLater();
}

void QVSensorProxyOrientation::handleChange(sd_bus_message* signal) {
  if (state_ != State::claimed || !isFrom(signal, owner_)) return;
  const char* name = nullptr;
  if (sd_bus_message_skip(signal, "s") < 0 ||
      sd_bus_message_enter_container(signal, SD_BUS_TYPE_ARRAY, "{sv}") < 0) {
    return;
  }
  while (sd_bus_message_enter_container(signal, SD_BUS_TYPE_DICT_ENTRY, "sv") > 0 &&
         sd_bus_message_read(signal, "s", &name) > 0) {
    if (std::string_view(name) == kProperty) {
      value_ = orientationIn(signal);
      return;
    }
    if (sd_bus_message_skip(signal, "v") < 0 || sd_bus_message_exit_container(signal) < 0) return;
  }
}

void QVSensorProxyOrientation::forgetCall() {
  call_ = sd_bus_slot_unref(call_);
}

void QVSensorProxyOrientation::tell() {
  if (value_) registrations_.report(period_, *value_);
}

void QVSensorProxyOrientation::note(const std::string& trouble) {
  if (std::exchange(trouble_, trouble) == trouble) return;
  log_.info(nullptr, "-[QVSensorProxyOrientation note:]", "the device's orientation is undefined, ",
            trouble);
}
