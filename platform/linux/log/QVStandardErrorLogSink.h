#pragma once

#include "platform/linux/log/QVLogSink.h"

#include <string_view>

// Lines of the form "<5>[qvrs] file.cpp:12:function: text" to a descriptor, whole batches at a
// time. Pipes and sockets that nobody reads are waited for in the kernel's poll, never in a write,
// so that the end of the service does not hang on them.
class QVStandardErrorLogSink final : public QVLogSink {
 public:
  // The descriptor stays its owner's; its flags, which other processes may share, are left alone.
  explicit QVStandardErrorLogSink(int descriptor);

  void write(std::span<const QVLogLine> lines, const std::atomic<bool>& giveUp) override;

 private:
  bool waitUntilWritable(const std::atomic<bool>& giveUp) const;
  void writeText(std::string_view text, const std::atomic<bool>& giveUp) const;

  const int descriptor_;
  const bool isSocket_;
  const bool isFile_;
};

// Appends the line as it is written, newline included.
void QVAppendLogLine(std::string& out, const QVLogLine& line);
