#pragma once

#include "platform/QVProcess.h"

#include <map>
#include <mutex>
#include <string_view>
#include <vector>

// A process table that tests write, and an exit that only notes its status. Threads: any, at once.
class QVFakeProcess final : public QVProcess {
 public:
  static constexpr int32_t kOwnProcessIdentifier = 100;
  static constexpr std::string_view kOwnProcessName = "quietvoxd";

  int32_t ownProcessIdentifier() const override {
    const std::lock_guard lock(mutex_);
    return ownProcessIdentifier_;
  }
  std::string ownProcessName() const override {
    const std::lock_guard lock(mutex_);
    return ownProcessName_;
  }
  std::optional<std::string> nameOfProcess(int32_t processIdentifier) const override {
    const std::lock_guard lock(mutex_);
    ++lookUpCount_;
    if (processIdentifier == ownProcessIdentifier_) return ownProcessName_;
    const auto found = names_.find(processIdentifier);
    if (found == names_.end()) return std::nullopt;
    return found->second;
  }
  void exitImmediately(int status) override {
    const std::lock_guard lock(mutex_);
    exitStatuses_.push_back(status);
  }

  void setOwnProcess(int32_t processIdentifier, std::string name) {
    const std::lock_guard lock(mutex_);
    ownProcessIdentifier_ = processIdentifier;
    ownProcessName_ = std::move(name);
  }
  void addProcess(int32_t processIdentifier, std::string name) {
    const std::lock_guard lock(mutex_);
    names_[processIdentifier] = std::move(name);
  }
  // How often nameOfProcess() was asked.
  int lookUpCount() const {
    const std::lock_guard lock(mutex_);
    return lookUpCount_;
  }
  std::vector<int> exitStatuses() const {
    const std::lock_guard lock(mutex_);
    return exitStatuses_;
  }

 private:
  mutable std::mutex mutex_;
  // Guarded by mutex_.
  int32_t ownProcessIdentifier_ = kOwnProcessIdentifier;
  std::string ownProcessName_{kOwnProcessName};
  std::map<int32_t, std::string> names_;
  std::vector<int> exitStatuses_;
  mutable int lookUpCount_ = 0;
};
