#include "tests/support/QVDaemonProcess.h"

#include "tests/support/QVTestBus.h"

#include <csignal>
#include <fstream>
#include <iterator>
#include <stdexcept>

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <time.h>
#include <unistd.h>

namespace {

constexpr std::chrono::seconds kReadinessLimit{60};

std::filesystem::path readinessPath(const QVTemporaryRoot& root) {
  return root.path() / "ready";
}

QVSubprocess::Options processOptions(const QVTemporaryRoot& root,
                                     const QVDaemonProcess::Options& options) {
  QVSubprocess::Options process{.arguments = options.wrapper,
                                .environment = options.environment,
                                .standardOutputFile = root.log(),
                                .standardErrorFile = root.log(),
                                .inheritedDescriptor = options.inheritedSocket};
  process.arguments.push_back(QVDaemonProcess::program().string());
  process.environment.merge(QVDaemonProcess::environment(root));
  return process;
}

std::string contents(const std::filesystem::path& file) {
  std::ifstream stream(file);
  return {std::istreambuf_iterator<char>(stream), {}};
}

}  // namespace

std::filesystem::path QVDaemonProcess::program(const std::string& name) {
  return std::filesystem::read_symlink("/proc/self/exe").parent_path() / name;
}

std::filesystem::path QVDaemonProcess::program() {
  return program("quietvoxd");
}

std::map<std::string, std::string> QVDaemonProcess::environment(const QVTemporaryRoot& root) {
  return {{"RUNTIME_DIRECTORY", root.runtime()},
          {"STATE_DIRECTORY", root.state()},
          {"LOGS_DIRECTORY", root.logs()},
          {"CONFIGURATION_DIRECTORY", root.configuration()},
          // Not the machine's own bus.
          {"DBUS_SYSTEM_BUS_ADDRESS", QVTestBus::address(root.path())},
          {"NOTIFY_SOCKET", readinessPath(root)}};
}

int QVDaemonProcess::makeReadinessSocket(const QVTemporaryRoot& root) {
  const int socket = ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
  sockaddr_un address{.sun_family = AF_UNIX, .sun_path = {}};
  const std::string path = readinessPath(root);
  ::unlink(path.c_str());
  path.copy(address.sun_path, sizeof address.sun_path - 1);
  if (::bind(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    throw std::runtime_error("cannot bind " + path);
  }
  return socket;
}

QVDaemonProcess::QVDaemonProcess(const QVTemporaryRoot& root, const Options& options)
    : root_(root), readiness_(makeReadinessSocket(root)), process_(processOptions(root, options)) {
  pollfd events[] = {{readiness_, POLLIN, 0}, {process_.endDescriptor(), POLLIN, 0}};
  const auto limit = std::chrono::milliseconds(kReadinessLimit);
  if (::poll(events, 2, static_cast<int>(limit.count())) > 0 && events[0].revents != 0 &&
      nextNotification().find("READY=1") != std::string::npos) {
    return;
  }
  throw std::runtime_error("the service did not become ready:\n" + log());
}

QVDaemonProcess::~QVDaemonProcess() {
  ::close(readiness_);
}

std::string QVDaemonProcess::nextNotification() const {
  pollfd event{readiness_, POLLIN, 0};
  const auto limit = std::chrono::milliseconds(kReadinessLimit);
  if (::poll(&event, 1, static_cast<int>(limit.count())) != 1) return {};
  char text[256];
  const ssize_t length = ::recv(readiness_, text, sizeof text, 0);
  return {text, length > 0 ? static_cast<std::size_t>(length) : 0};
}

std::string QVDaemonProcess::log() const {
  return contents(root_.log());
}

std::optional<QVSubprocess::Status> QVDaemonProcess::terminate() {
  signal(SIGTERM);
  return wait();
}

std::chrono::nanoseconds QVDaemonProcess::processorTime() const {
  clockid_t clock;
  timespec time;
  if (::clock_getcpuclockid(pid(), &clock) != 0 || ::clock_gettime(clock, &time) != 0) {
    throw std::runtime_error("the service has no processor clock");
  }
  return std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec);
}

long QVDaemonProcess::statusNumber(const std::string& file, const std::string& key) const {
  const std::string text = contents("/proc/" + std::to_string(pid()) + "/" + file);
  const auto line = text.find(key + ":");
  if (line == std::string::npos) throw std::runtime_error("no " + key + " in " + file);
  return std::stol(text.substr(line + key.size() + 1));
}

std::size_t QVDaemonProcess::openDescriptors() const {
  const std::filesystem::directory_iterator listed("/proc/" + std::to_string(pid()) + "/fd");
  return static_cast<std::size_t>(std::distance(begin(listed), end(listed)));
}
