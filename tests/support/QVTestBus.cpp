#include "tests/support/QVTestBus.h"

#include <fstream>
#include <stdexcept>

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

namespace {

constexpr const char* kConfiguration = R"(<!DOCTYPE busconfig PUBLIC
 "-//freedesktop//DTD D-Bus Bus Configuration 1.0//EN"
 "http://www.freedesktop.org/standards/dbus/1.0/busconfig.dtd">
<busconfig>
  <type>session</type>
  <listen>systemd:</listen>
  <auth>EXTERNAL</auth>
  <policy context="default">
    <allow send_destination="*"/>
    <allow receive_sender="*"/>
    <allow own="*"/>
  </policy>
</busconfig>
)";

std::filesystem::path socketIn(const std::filesystem::path& directory) {
  return directory / "bus";
}

// Handed over as it listens: nobody has to wait until the bus has started.
int listenAt(const std::string& path) {
  ::unlink(path.c_str());
  const int socket = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  sockaddr_un address{.sun_family = AF_UNIX, .sun_path = {}};
  path.copy(address.sun_path, sizeof address.sun_path - 1);
  if (::bind(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
      ::listen(socket, SOMAXCONN) != 0) {
    throw std::runtime_error("cannot listen at " + path);
  }
  return socket;
}

}  // namespace

QVTestBus::QVTestBus(const std::filesystem::path& directory) {
  const std::filesystem::path configuration = directory / "bus.conf";
  std::ofstream(configuration) << kConfiguration;
  const int socket = listenAt(socketIn(directory));
  process_.emplace(QVSubprocess::Options{
      .arguments = {"dbus-daemon", "--config-file=" + configuration.string(),
                    "--address=systemd:", "--nofork", "--nopidfile", "--nosyslog"},
      .standardErrorFile = directory / "bus.log",
      .inheritedDescriptor = socket});
  ::close(socket);
}

std::string QVTestBus::address(const std::filesystem::path& directory) {
  return "unix:path=" + socketIn(directory).string();
}
