#include "platform/linux/bus/QVBusStandardInterfaces.h"

#include "platform/QVText.h"
#include "platform/linux/bus/QVBusObjectTree.h"
#include "platform/linux/bus/QVReportingServiceInterface.h"

#include <array>
#include <fstream>
#include <initializer_list>

namespace {

// The service on the bus that tools believe to see: one process, reachable under every name, that
// owns these.
constexpr std::string_view kUniqueName = ":1.0";
constexpr std::array<std::string_view, 2> kWellKnownNames{"net.quillon.quietvox",
                                                          "net.quillon.quietvox.ReportingService"};

// Results of the bus's methods.
constexpr uint32_t kPrimaryOwner = 1;
constexpr uint32_t kNameExists = 3;
constexpr uint32_t kReleased = 1;
constexpr uint32_t kNotOwner = 3;
constexpr uint32_t kAlreadyRunning = 2;

// Where the machine's ID lies; the second place is the older one.
constexpr std::array<const char*, 2> kMachineIDFiles{"/etc/machine-id", "/var/lib/dbus/machine-id"};
constexpr std::size_t kMachineIDLength = 32;

bool isOurs(std::string_view name) {
  return name == kWellKnownNames[0] || name == kWellKnownNames[1] || name == kUniqueName;
}

std::string uniqueNameOf(const QVBusCall& call) {
  return QVText(":1.", call.connectionNumber);
}

void giveNumber(const QVBusReply& reply, uint32_t number) {
  reply.give("u", [number](QVBusWriter& writer) { writer.writeNumber(number); });
}

void giveStrings(const QVBusReply& reply, std::initializer_list<std::string_view> strings) {
  reply.give("as", [strings](QVBusWriter& writer) {
    const auto array = writer.beginArray(4);
    for (const auto string : strings) writer.writeString(string);
    writer.endArray(array);
  });
}

}  // namespace

const char* QVBusStandardInterfaces::handle(const QVBusCall& call) {
  const QVBusMessage& message = call.message;
  if (const char* reason = message.checkBody()) return reason;

  // A peer answers a ping at any path.
  const bool exists = QVBusObjectTree::contains(message.path());
  if (!exists && message.interface() != kBusPeer) {
    call.reply.giveError(kBusErrorUnknownObject, QVText("there is no object at ", message.path()));
    return nullptr;
  }
  const auto* member = QVBusObjectTree::find(message.path(), message.interface(), message.member());
  if (member != nullptr) {
    if (QVBusExpectSignature(call, member->in)) answer(call, member->interface);
  } else if (!message.interface().empty() &&
             !QVBusObjectTree::hasInterface(message.path(), message.interface())) {
    call.reply.giveError(
        kBusErrorUnknownInterface,
        QVText("there is no interface ", message.interface(), " at ", message.path()));
  } else {
    call.reply.giveError(kBusErrorUnknownMethod,
                         QVText("there is no method ", message.member(), " at ", message.path()));
  }
  return nullptr;
}

void QVBusStandardInterfaces::answer(const QVBusCall& call, std::string_view interface) {
  const auto member = call.message.member();
  if (interface == kBusIntrospectable) {
    call.reply.giveString(QVBusObjectTree::introspect(call.message.path()));
  } else if (interface == kBusPeer) {
    if (member == "Ping") {
      call.reply.giveNothing();
    } else {
      giveMachineID(call.reply);
    }
  } else if (interface == kBusProperties) {
    answerProperties(call);
  } else if (interface == kBusItself) {
    answerBus(call);
  } else {
    // The service's own interface, on a connection that exports nothing.
    call.reply.giveError(kBusErrorUnknownObject,
                         QVText("nothing is exported at ", call.message.path()));
  }
}

void QVBusStandardInterfaces::answerProperties(const QVBusCall& call) {
  auto reader = call.message.bodyReader();
  const auto interface = reader.readString();
  // An empty name means any interface.
  if (!interface.empty() && !QVBusObjectTree::hasInterface(call.message.path(), interface)) {
    call.reply.giveError(kBusErrorUnknownInterface,
                         QVText("there is no interface ", interface, " at ", call.message.path()));
  } else if (call.message.member() == "GetAll") {
    call.reply.give("a{sv}", [](QVBusWriter& writer) { writer.writeDictionary({}); });
  } else {
    call.reply.giveError(kBusErrorUnknownProperty,
                         QVText("there is no property ", reader.readString()));
  }
}

void QVBusStandardInterfaces::answerBus(const QVBusCall& call) {
  const auto member = call.message.member();
  if (member == "Hello") {
    call.reply.giveString(uniqueNameOf(call));
  } else if (member == "ListNames") {
    giveStrings(call.reply, {kBusItself, kUniqueName, uniqueNameOf(call), kWellKnownNames[0],
                             kWellKnownNames[1]});
  } else if (member == "ListActivatableNames") {
    giveStrings(call.reply, {kBusItself, kWellKnownNames[0], kWellKnownNames[1]});
  } else if (member == "AddMatch" || member == "RemoveMatch") {
    // There are no signals that a rule could match.
    call.reply.giveNothing();
  } else {
    answerBusName(call, call.message.bodyReader().readString());
  }
}

void QVBusStandardInterfaces::answerBusName(const QVBusCall& call, std::string_view name) {
  const auto member = call.message.member();
  const bool ours = isOurs(name);
  const bool itself = name == kBusItself;
  const bool callers = name == uniqueNameOf(call);
  if (member == "GetNameOwner") {
    if (ours) {
      call.reply.giveString(kUniqueName);
    } else if (itself || callers) {
      call.reply.giveString(name);
    } else {
      call.reply.giveError(kBusErrorNameHasNoOwner, QVText("nobody owns ", name));
    }
  } else if (member == "NameHasOwner") {
    call.reply.giveBoolean(ours || itself || callers);
  } else if (member == "StartServiceByName") {
    if (ours || itself) {
      giveNumber(call.reply, kAlreadyRunning);
    } else {
      call.reply.giveError(kBusErrorServiceUnknown, QVText("there is no service ", name));
    }
  } else if (member == "RequestName") {
    // A client may have any other name: nobody is going to call it there.
    giveNumber(call.reply, ours || itself ? kNameExists : kPrimaryOwner);
  } else {
    giveNumber(call.reply, ours || itself ? kNotOwner : kReleased);
  }
}

void QVBusStandardInterfaces::giveMachineID(const QVBusReply& reply) {
  for (const char* path : kMachineIDFiles) {
    if (!machineID_.empty()) break;
    std::ifstream file(path);
    std::string line;
    if (std::getline(file, line) && line.size() == kMachineIDLength) machineID_ = line;
  }
  if (machineID_.empty()) {
    reply.giveError(kBusErrorFileNotFound, "this machine has no ID");
  } else {
    reply.giveString(machineID_);
  }
}
