#include "platform/linux/bus/QVBusObjectTree.h"

#include "platform/linux/bus/QVBusSignature.h"
#include "platform/linux/bus/QVReportingServiceInterface.h"

#include <array>
#include <set>

namespace {

// Of every node; members of one interface lie together.
constexpr std::array<QVBusMemberDescription, 6> kCommonMembers{{
    {kBusIntrospectable, "Introspect", "", "", "s", "document"},
    {kBusPeer, "Ping", "", "", "", ""},
    {kBusPeer, "GetMachineId", "", "", "s", "machineID"},
    {kBusProperties, "Get", "ss", "interface property", "v", "value"},
    {kBusProperties, "GetAll", "s", "interface", "a{sv}", "properties"},
    {kBusProperties, "Set", "ssv", "interface property value", "", ""},
}};

constexpr std::array<QVBusMemberDescription, 10> kBusMembers{{
    {kBusItself, "Hello", "", "", "s", "uniqueName"},
    {kBusItself, "AddMatch", "s", "rule", "", ""},
    {kBusItself, "RemoveMatch", "s", "rule", "", ""},
    {kBusItself, "GetNameOwner", "s", "name", "s", "uniqueName"},
    {kBusItself, "NameHasOwner", "s", "name", "b", "hasOwner"},
    {kBusItself, "ListNames", "", "", "as", "names"},
    {kBusItself, "ListActivatableNames", "", "", "as", "names"},
    {kBusItself, "StartServiceByName", "su", "name flags", "u", "result"},
    {kBusItself, "RequestName", "su", "name flags", "u", "result"},
    {kBusItself, "ReleaseName", "s", "name", "u", "result"},
}};

struct Object {
  std::string_view path;
  std::span<const QVBusMemberDescription> members;
};
constexpr std::array<Object, 2> kObjects{{
    {kReportingServicePath, kReportingServiceMembers},
    {QVBusObjectTree::kBusPath, kBusMembers},
}};

// What comes behind `path` on the way to an object below it; empty where that lies elsewhere.
std::string_view below(std::string_view path, std::string_view objectPath) {
  if (path == "/") return objectPath.substr(1);
  if (objectPath.size() <= path.size() || !objectPath.starts_with(path) ||
      objectPath[path.size()] != '/') {
    return {};
  }
  return objectPath.substr(path.size() + 1);
}

std::span<const QVBusMemberDescription> membersOf(std::string_view path) {
  for (const auto& object : kObjects) {
    if (object.path == path) return object.members;
  }
  return {};
}

void appendArguments(std::string& out, std::string_view text, std::string_view names,
                     std::string_view direction) {
  QVBusSignature signature;
  if (!signature.parse(text)) return;
  for (std::size_t index = 0; index < text.size(); index = signature.endOf(index)) {
    const auto name = names.substr(0, names.find(' '));
    names.remove_prefix(name.size() < names.size() ? name.size() + 1 : name.size());
    out.append("      <arg name=\"").append(name).append("\" type=\"");
    out.append(text.substr(index, signature.endOf(index) - index));
    out.append("\" direction=\"").append(direction).append("\"/>\n");
  }
}

void appendInterfaces(std::string& out, std::span<const QVBusMemberDescription> members) {
  for (std::size_t i = 0; i < members.size(); ++i) {
    const auto& member = members[i];
    if (i == 0 || members[i - 1].interface != member.interface) {
      out.append("  <interface name=\"").append(member.interface).append("\">\n");
    }
    out.append("    <method name=\"").append(member.member).append("\">\n");
    appendArguments(out, member.in, member.inNames, "in");
    appendArguments(out, member.out, member.outNames, "out");
    out.append("    </method>\n");
    if (i + 1 == members.size() || members[i + 1].interface != member.interface) {
      out.append("  </interface>\n");
    }
  }
}

}  // namespace

bool QVBusObjectTree::contains(std::string_view path) {
  for (const auto& object : kObjects) {
    if (object.path == path || !below(path, object.path).empty()) return true;
  }
  return false;
}

bool QVBusObjectTree::hasInterface(std::string_view path, std::string_view interface) {
  const auto members = membersOf(path);
  if (!members.empty() && members.front().interface == interface) return true;
  for (const auto& member : kCommonMembers) {
    if (member.interface == interface) return true;
  }
  return false;
}

const QVBusMemberDescription* QVBusObjectTree::find(std::string_view path,
                                                    std::string_view interface,
                                                    std::string_view member) {
  for (const auto members :
       {membersOf(path), std::span<const QVBusMemberDescription>(kCommonMembers)}) {
    for (const auto& candidate : members) {
      if (candidate.member == member && (interface.empty() || candidate.interface == interface)) {
        return &candidate;
      }
    }
  }
  return nullptr;
}

std::string QVBusObjectTree::introspect(std::string_view path) {
  std::string out =
      "<!DOCTYPE node PUBLIC \"-//freedesktop//DTD D-BUS Object Introspection 1.0//EN\"\n"
      " \"http://www.freedesktop.org/standards/dbus/1.0/introspect.dtd\">\n"
      "<node>\n";
  appendInterfaces(out, membersOf(path));
  appendInterfaces(out, kCommonMembers);
  std::set<std::string_view> children;
  for (const auto& object : kObjects) {
    const auto rest = below(path, object.path);
    if (!rest.empty()) children.insert(rest.substr(0, rest.find('/')));
  }
  for (const auto child : children) {
    out.append("  <node name=\"").append(child).append("\"/>\n");
  }
  out.append("</node>\n");
  return out;
}
