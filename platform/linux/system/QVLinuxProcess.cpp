#include "platform/linux/system/QVLinuxProcess.h"

#include "platform/linux/bus/QVBusText.h"

#include <array>
#include <cerrno>
#include <string_view>
#include <utility>

#include <fcntl.h>
#include <unistd.h>

namespace {

constexpr std::size_t kCommBytes = 64;   // 16 today, with the newline; workers' may be longer
constexpr std::size_t kLongestTail = 3;  // bytes of a character without its last one

std::optional<std::string> readComm(const std::string& path) {
  const int file = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (file < 0) return std::nullopt;
  std::array<char, kCommBytes> bytes;
  const ssize_t count = read(file, bytes.data(), bytes.size());
  close(file);
  if (count <= 0) return std::nullopt;
  std::string name(bytes.data(), static_cast<std::size_t>(count));
  // The file's own newline; a name may have more.
  if (name.back() == '\n') name.pop_back();
  return name;
}

std::size_t lengthOfCharacter(unsigned char lead) {
  if (lead >= 0xF0 && lead <= 0xF4) return 4;
  if (lead >= 0xE0) return lead < 0xF0 ? 3 : 0;
  return lead >= 0xC2 ? 2 : 0;
}

// Bytes at the end that begin a character and do not finish it.
std::size_t lengthOfCutCharacter(std::string_view name) {
  for (std::size_t tail = 1; tail <= kLongestTail && tail <= name.size(); ++tail) {
    const auto byte = static_cast<unsigned char>(name[name.size() - tail]);
    if ((byte & 0xC0U) != 0x80U) return lengthOfCharacter(byte) > tail ? tail : 0;
  }
  return 0;
}

std::optional<std::string> validText(std::string name) {
  name.resize(name.size() - lengthOfCutCharacter(name));
  if (!QVBusIsValidText(name)) return std::nullopt;
  return name;
}

}  // namespace

QVLinuxProcess::QVLinuxProcess(std::string processTable) : processTable_(std::move(processTable)) {}

int32_t QVLinuxProcess::ownProcessIdentifier() const {
  return getpid();
}

// Without a process table there is still the name under which the program was started.
std::string QVLinuxProcess::ownProcessName() const {
  return nameOfProcess(ownProcessIdentifier()).value_or(program_invocation_short_name);
}

std::optional<std::string> QVLinuxProcess::nameOfProcess(int32_t processIdentifier) const {
  if (processIdentifier < 1) return std::nullopt;
  auto name = readComm(processTable_ + "/" + std::to_string(processIdentifier) + "/comm");
  if (!name) return std::nullopt;
  return validText(std::move(*name));
}

void QVLinuxProcess::exitImmediately(int status) {
  _exit(status);
}
