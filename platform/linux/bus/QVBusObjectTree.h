#pragma once

#include "platform/linux/bus/QVBusMemberDescription.h"

#include <span>
#include <string>
#include <string_view>

// The objects that a connection shows: the service, the bus that tools believe to see, and the
// nodes on the way to them. The same for every connection. Pure; any thread.
class QVBusObjectTree {
 public:
  static constexpr std::string_view kBusPath = "/org/freedesktop/DBus";

  // Is there an object, or a node on the way to one?
  static bool contains(std::string_view path);
  static bool hasInterface(std::string_view path, std::string_view interface);
  // The member as the path's object has it; an empty interface means the one that has the member.
  // Null where there is none.
  static const QVBusMemberDescription* find(std::string_view path, std::string_view interface,
                                            std::string_view member);
  // The introspection document of a path that the tree contains.
  static std::string introspect(std::string_view path);
};

// Interfaces of the tree, the service's own aside.
inline constexpr std::string_view kBusIntrospectable = "org.freedesktop.DBus.Introspectable";
inline constexpr std::string_view kBusPeer = "org.freedesktop.DBus.Peer";
inline constexpr std::string_view kBusProperties = "org.freedesktop.DBus.Properties";
inline constexpr std::string_view kBusItself = "org.freedesktop.DBus";
