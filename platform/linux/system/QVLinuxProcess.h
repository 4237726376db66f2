#pragma once

#include "platform/QVProcess.h"

#include <string>

// This process and others as /proc shows them. Threads: any; reads files of the kernel, which do
// not block.
class QVLinuxProcess final : public QVProcess {
 public:
  // `processTable` is where the kernel's process table is mounted.
  explicit QVLinuxProcess(std::string processTable = "/proc");

  int32_t ownProcessIdentifier() const override;
  std::string ownProcessName() const override;
  // A name that is no UTF-8 counts as not told; but a character that the kernel cut at the end (it
  // keeps 15 bytes) is only left out.
  std::optional<std::string> nameOfProcess(int32_t processIdentifier) const override;
  void exitImmediately(int status) override;

 private:
  const std::string processTable_;
};
