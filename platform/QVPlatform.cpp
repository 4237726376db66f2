#include "platform/QVPlatform.h"

#include <atomic>

namespace {

std::atomic<QVPlatform*> installed{nullptr};
std::atomic<uint64_t> installations{0};

}  // namespace

void QVPlatform::install(QVPlatform* platform) {
  installed.store(platform, std::memory_order_release);
  installations.fetch_add(1, std::memory_order_acq_rel);
}

QVPlatform& QVPlatform::shared() {
  return *installed.load(std::memory_order_acquire);
}

uint64_t QVPlatform::generation() {
  return installations.load(std::memory_order_acquire);
}
