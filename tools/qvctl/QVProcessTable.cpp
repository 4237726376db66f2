#include "tools/qvctl/QVProcessTable.h"

#include "platform/linux/files/QVRegularFile.h"

#include <algorithm>
#include <charconv>
#include <filesystem>
#include <string_view>
#include <system_error>

#include <unistd.h>

namespace {

// Bytes of the files of /proc that are read here; a line of each is wanted.
constexpr std::size_t kMaximumBytes = std::size_t{1} << 20;

// The field of /proc/PID/stat, counted behind the name, that holds the start in ticks since boot.
constexpr int kStartField = 19;

constexpr std::string_view kSocket = "socket:[";

std::string placeOf(pid_t pid, const char* file) {
  std::string path = "/proc/";
  return path.append(std::to_string(pid)).append("/").append(file);
}

std::string read(const std::string& path) {
  const QVRegularFile file(path, QVRegularFile::Links::follow);
  std::string text;
  if (file.error() != 0 || file.read(kMaximumBytes, text) != 0) text.clear();
  return text;
}

template <class Number>
std::optional<Number> numberIn(std::string_view text) {
  Number number = 0;
  const auto [end, problem] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (problem != std::errc()) return std::nullopt;
  return number;
}

std::optional<int64_t> bootTime() {
  constexpr std::string_view kLine = "\nbtime ";
  const std::string text = read("/proc/stat");
  const std::size_t found = text.find(kLine);
  if (found == std::string::npos) return std::nullopt;
  return numberIn<int64_t>(std::string_view(text).substr(found + kLine.size()));
}

// The sockets that a process has open; false where that is not to be seen.
bool addSockets(pid_t pid, std::vector<uint32_t>& sockets) {
  std::error_code error;
  std::filesystem::directory_iterator entries(placeOf(pid, "fd"), error);
  for (; !error && entries != std::filesystem::directory_iterator(); entries.increment(error)) {
    std::error_code gone;
    const std::string target = std::filesystem::read_symlink(entries->path(), gone).string();
    if (!target.starts_with(kSocket)) continue;
    const auto inode = numberIn<uint32_t>(std::string_view(target).substr(kSocket.size()));
    if (inode) sockets.push_back(*inode);
  }
  return error != std::errc::permission_denied;
}

}  // namespace

std::vector<pid_t> QVProcessTable::all() {
  std::vector<pid_t> pids;
  std::error_code error;
  std::filesystem::directory_iterator entries("/proc", error);
  for (; !error && entries != std::filesystem::directory_iterator(); entries.increment(error)) {
    const std::string name = entries->path().filename().string();
    const auto pid = numberIn<pid_t>(name);
    if (pid && *pid > 0) pids.push_back(*pid);
  }
  std::ranges::sort(pids);
  return pids;
}

std::string QVProcessTable::name(pid_t pid) {
  std::string text = read(placeOf(pid, "comm"));
  if (text.ends_with('\n')) text.pop_back();
  return text;
}

std::optional<uid_t> QVProcessTable::user(pid_t pid) {
  // The user who started it, then whose rights it has.
  constexpr std::string_view kLine = "\nUid:\t";
  const std::string text = read(placeOf(pid, "status"));
  const std::size_t line = text.find(kLine);
  if (line == std::string::npos) return std::nullopt;
  const std::size_t next = text.find('\t', line + kLine.size());
  if (next == std::string::npos) return std::nullopt;
  return numberIn<uid_t>(std::string_view(text).substr(next + 1));
}

std::optional<int64_t> QVProcessTable::startTime(pid_t pid) {
  const std::string text = read(placeOf(pid, "stat"));
  // The name, in parentheses, may hold anything.
  std::size_t place = text.rfind(')');
  for (int field = 0; field <= kStartField && place != std::string::npos; ++field) {
    place = text.find(' ', place + 1);
  }
  if (place == std::string::npos) return std::nullopt;
  const auto ticks = numberIn<int64_t>(std::string_view(text).substr(place + 1));
  const auto boot = bootTime();
  const int64_t ticksPerSecond = ::sysconf(_SC_CLK_TCK);
  if (!ticks || !boot || ticksPerSecond <= 0) return std::nullopt;
  constexpr int64_t kMicroseconds = 1'000'000;
  return *boot * kMicroseconds + *ticks * (kMicroseconds / ticksPerSecond);
}

std::map<uint32_t, std::vector<pid_t>> QVProcessTable::holders(const std::set<uint32_t>& sockets,
                                                               std::vector<pid_t>& hidden) {
  std::map<uint32_t, std::vector<pid_t>> holders;
  for (const pid_t pid : all()) {
    std::vector<uint32_t> open;
    if (!addSockets(pid, open)) hidden.push_back(pid);
    for (const uint32_t socket : open) {
      if (sockets.contains(socket)) holders[socket].push_back(pid);
    }
  }
  return holders;
}
