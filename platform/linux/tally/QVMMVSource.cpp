#include "platform/linux/tally/QVMMVSource.h"

#include "platform/linux/files/QVRegularFile.h"
#include "platform/linux/tally/QVMMVFormat.h"

#include <cerrno>
#include <utility>

namespace {

int readOnce(const QVRegularFile& file, QVChannelReadings& readings) {
  readings.subgroups.clear();
  readings.channels.clear();
  if (const int error = file.read(QVMMVFormat::kMaximumBytes, readings.text)) return error;
  const int outcome = QVMMVFormat::parse(readings.text, readings);
  // Whoever writes the file anew in its place begins with another generation: then the values that
  // were read, or what was found wrong with them, may be of both.
  std::string header;
  if (const int error = file.readBeginning(QVMMVFormat::kHeaderBytes, header)) return error;
  return QVMMVFormat::sameHeader(readings.text, header) ? outcome : EAGAIN;
}

}  // namespace

QVMMVSource::QVMMVSource(const std::string& directory, std::string group)
    : group_(std::move(group)), path_(directory + '/' + group_) {}

int QVMMVSource::read(QVChannelReadings& readings) const {
  const QVRegularFile file(path_, QVRegularFile::Links::refuse);
  if (file.error() != 0) return file.error();
  int error = EAGAIN;
  for (int reading = 0; reading < kReadings && error == EAGAIN; ++reading) {
    error = readOnce(file, readings);
  }
  return error;
}
