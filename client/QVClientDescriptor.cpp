#include "client/QVClientDescriptor.h"

#include <unistd.h>

QVClientDescriptor& QVClientDescriptor::operator=(QVClientDescriptor&& other) noexcept {
  if (this != &other) {
    if (isOpen()) close(descriptor_);
    descriptor_ = std::exchange(other.descriptor_, -1);
  }
  return *this;
}

QVClientDescriptor::~QVClientDescriptor() {
  if (isOpen()) close(descriptor_);
}
