#include "fuzz/QVFuzzFiles.h"
#include "platform/linux/files/QVJSONFile.h"
#include "platform/linux/files/QVJSONScan.h"
#include "platform/linux/files/QVRegularFile.h"

#include <cstdlib>
#include <string>

#include <sys/mman.h>
#include <unistd.h>

namespace {

void require(bool condition) {
  if (!condition) std::abort();
}

// The bytes as a file, which is made once and written anew for each input.
std::string fileOf(std::string_view bytes) {
  static const int file = ::memfd_create("scanned", MFD_CLOEXEC);
  require(file >= 0 && ::ftruncate(file, 0) == 0);
  require(::pwrite(file, bytes.data(), bytes.size(), 0) == static_cast<ssize_t>(bytes.size()));
  return "/proc/self/fd/" + std::to_string(file);
}

class Counter : public QVJSONReceiver {
 public:
  void begin(Container /*container*/) override {
    ++values;
    ++depth;
  }
  void end(Container /*container*/) override {
    require(depth > 0);
    --depth;
  }
  void string(std::string_view /*text*/) override { ++values; }
  void number(std::string_view digits) override {
    require(!digits.empty());
    ++values;
  }
  void boolean(bool /*value*/) override { ++values; }
  void null() override { ++values; }

  std::size_t values = 0;
  std::size_t depth = 0;
};

}  // namespace

QVFuzzFileProgress QVFuzzJSONScan(std::string_view input) {
  const QVRegularFile file(fileOf(input), QVRegularFile::Links::follow);
  require(file.error() == 0);
  Counter counter;
  QVJSONFailure failure;
  const bool scanned = QVScanJSONArray(file, counter, failure);
  QVJSONFailure other;
  const auto value = QVJSONFile::parse(input, other);
  // It takes in every array that the other reader does, and says where it does not.
  require(scanned || !value || value->kind() != QVValue::Kind::array);
  if (!scanned) {
    require(!failure.reason.empty() && failure.line > 0 && failure.column > 0);
    return {};
  }
  require(counter.depth == 0);
  return {.accepted = 1, .items = counter.values};
}
