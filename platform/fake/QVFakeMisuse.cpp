#include "platform/fake/QVFakeMisuse.h"

#include <cstdio>
#include <cstdlib>
#include <utility>

QVFakeMisuse::~QVFakeMisuse() {
  if (notes_.empty()) return;
  for (const std::string& note : notes_) {
    std::fprintf(stderr, "%s used wrongly: %s\n", fake_.c_str(), note.c_str());
  }
  std::abort();
}

void QVFakeMisuse::note(std::string what) {
  const std::lock_guard lock(mutex_);
  notes_.push_back(std::move(what));
}

std::vector<std::string> QVFakeMisuse::take() {
  const std::lock_guard lock(mutex_);
  return std::exchange(notes_, {});
}
