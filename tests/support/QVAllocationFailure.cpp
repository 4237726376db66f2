#include "tests/support/QVAllocationFailure.h"

#include <cstdlib>
#include <new>

namespace {

enum class State { off, counting, happened };

thread_local State state = State::off;
thread_local std::size_t allocationsLeft = 0;

bool failsNow() {
  if (state != State::counting || allocationsLeft-- > 0) return false;
  state = State::happened;
  return true;
}

}  // namespace

QVAllocationFailure::QVAllocationFailure(std::size_t before) {
  allocationsLeft = before;
  state = State::counting;
}

QVAllocationFailure::~QVAllocationFailure() {
  state = State::off;
}

bool QVAllocationFailure::hasHappened() {
  return state == State::happened;
}

void* operator new(std::size_t bytes, const std::nothrow_t&) noexcept {
  return failsNow() ? nullptr : std::malloc(bytes);
}

void* operator new(std::size_t bytes) {
  void* const memory = operator new(bytes, std::nothrow);
  if (memory == nullptr) throw std::bad_alloc();
  return memory;
}

void operator delete(void* memory) noexcept {
  std::free(memory);
}

void operator delete(void* memory, std::size_t) noexcept {
  std::free(memory);
}
