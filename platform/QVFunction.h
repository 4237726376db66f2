#pragma once

#include <cstddef>
#include <memory>
#include <new>
#include <type_traits>
#include <utility>

// QVFunction is a move-only callable with room for its captures inside, for replies, completions
// and work items: the standard's copyable function would allocate for each of them and could not
// hold a move-only capture. Captures of up to `Capacity` bytes are kept in place, larger ones on
// the heap.
//
// Threads: none of its own; move it to the thread that calls it. A call on an empty QVFunction is
// a bug of the caller; test with `if (f)`. It may be called more than once.

template <class Signature, std::size_t Capacity = 32>
class QVFunction;

template <class Result, class... Arguments, std::size_t Capacity>
class QVFunction<Result(Arguments...), Capacity> {
 public:
  QVFunction() = default;
  QVFunction(std::nullptr_t) {}

  template <class Callable>
  requires(!std::is_same_v<std::remove_cvref_t<Callable>, QVFunction> &&
           std::is_invocable_r_v<Result, std::decay_t<Callable>&, Arguments...>)
      QVFunction(Callable&& callable) {
    using Stored = std::decay_t<Callable>;
    if constexpr (fitsInPlace<Stored>()) {
      new (storage_) Stored(std::forward<Callable>(callable));
      operations_ = &kInPlace<Stored>;
    } else {
      new (storage_) Stored*(new Stored(std::forward<Callable>(callable)));
      operations_ = &kOnHeap<Stored>;
    }
  }

  QVFunction(QVFunction&& other) noexcept { take(other); }
  QVFunction& operator=(QVFunction&& other) noexcept {
    if (this != &other) {
      reset();
      take(other);
    }
    return *this;
  }
  QVFunction& operator=(std::nullptr_t) noexcept {
    reset();
    return *this;
  }
  QVFunction(const QVFunction&) = delete;
  QVFunction& operator=(const QVFunction&) = delete;
  ~QVFunction() { reset(); }

  explicit operator bool() const noexcept { return operations_ != nullptr; }

  // By value, as the callable behind it may take them so.
  // NOLINTNEXTLINE(performance-unnecessary-value-param)
  Result operator()(Arguments... arguments) {
    // NOLINTNEXTLINE(clang-analyzer-core.NullDereference): an empty one is not called, see above.
    return operations_->invoke(storage_, std::forward<Arguments>(arguments)...);
  }

 private:
  struct Operations {
    Result (*invoke)(void* storage, Arguments&&... arguments);
    void (*move)(void* from, void* to) noexcept;
    void (*destroy)(void* storage) noexcept;
  };

  template <class Stored>
  static constexpr bool fitsInPlace() {
    return sizeof(Stored) <= Capacity && alignof(Stored) <= alignof(std::max_align_t) &&
           std::is_nothrow_move_constructible_v<Stored>;
  }

  template <class Stored>
  static Result call(Stored& callable, Arguments&&... arguments) {
    if constexpr (std::is_void_v<Result>) {
      callable(std::forward<Arguments>(arguments)...);  // a result that nobody asked for
    } else {
      return callable(std::forward<Arguments>(arguments)...);
    }
  }

  template <class Stored>
  static constexpr Operations kInPlace{
      [](void* storage, Arguments&&... arguments) -> Result {
        return call(*static_cast<Stored*>(storage), std::forward<Arguments>(arguments)...);
      },
      [](void* from, void* to) noexcept {
        auto* source = static_cast<Stored*>(from);
        new (to) Stored(std::move(*source));
        source->~Stored();
      },
      [](void* storage) noexcept { static_cast<Stored*>(storage)->~Stored(); }};

  template <class Stored>
  static constexpr Operations kOnHeap{
      [](void* storage, Arguments&&... arguments) -> Result {
        return call(**static_cast<Stored**>(storage), std::forward<Arguments>(arguments)...);
      },
      [](void* from, void* to) noexcept { new (to) Stored*(*static_cast<Stored**>(from)); },
      [](void* storage) noexcept { delete *static_cast<Stored**>(storage); }};

  void take(QVFunction& other) noexcept {
    if (other.operations_ == nullptr) return;
    other.operations_->move(other.storage_, storage_);
    operations_ = std::exchange(other.operations_, nullptr);
  }

  void reset() noexcept {
    if (operations_ == nullptr) return;
    std::exchange(operations_, nullptr)->destroy(storage_);
  }

  static_assert(Capacity >= sizeof(void*));
  alignas(std::max_align_t) std::byte storage_[Capacity];
  const Operations* operations_ = nullptr;
};
