#include "fuzz/QVFuzzFiles.h"
#include "platform/linux/tally/QVMMVFormat.h"

#include <cerrno>
#include <cstdlib>
#include <vector>

namespace {

void require(bool condition) {
  if (!condition) std::abort();
}

bool same(const QVChannelReadings& one, const QVChannelReadings& other) {
  if (one.channels.size() != other.channels.size()) return false;
  for (std::size_t i = 0; i < one.channels.size(); ++i) {
    const auto& left = one.channels[i];
    const auto& right = other.channels[i];
    if (left.subgroup != right.subgroup || left.name != right.name || left.value != right.value) {
      return false;
    }
  }
  return one.subgroups == other.subgroups;
}

}  // namespace

QVFuzzFileProgress QVFuzzMMV(std::string_view input) {
  // Memory of its own and of exactly that size, so that a look beyond is seen.
  const std::vector<char> memory(input.begin(), input.end());
  const std::string_view bytes(memory.data(), memory.size());
  const auto within = [&bytes](std::string_view text) {
    return text.data() >= bytes.data() && text.data() + text.size() <= bytes.data() + bytes.size();
  };
  QVChannelReadings readings;
  QVChannelReadings again;
  const int error = QVMMVFormat::parse(bytes, readings);
  require(error == 0 || error == EBADMSG || error == EAGAIN || error == ENOTSUP);
  require(QVMMVFormat::parse(input, again) == error);
  if (error != 0) return {};
  require(same(readings, again));
  require(readings.channels.size() * 32 <= bytes.size());
  for (const auto& channel : readings.channels) {
    require(channel.name.empty() || within(channel.name));
    require(channel.name.size() < 64);
    if (!channel.subgroup) continue;
    require(within(*channel.subgroup) && channel.subgroup->size() < 64);
  }
  return {.accepted = 1, .items = readings.channels.size()};
}
