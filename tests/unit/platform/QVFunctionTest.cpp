#include "platform/QVFunction.h"

#include <array>
#include <functional>
#include <memory>
#include <string>
#include <type_traits>
#include <utility>

#include <gtest/gtest.h>

namespace {

// Counts the copies of itself that are alive; `Padding` decides whether it fits in place.
template <std::size_t Padding>
struct Counted {
  explicit Counted(int& alive) : aliveCount(&alive) { ++alive; }
  Counted(const Counted& other) : aliveCount(other.aliveCount) { ++*aliveCount; }
  Counted(Counted&& other) noexcept : aliveCount(other.aliveCount) { ++*aliveCount; }
  ~Counted() { --*aliveCount; }
  Counted& operator=(const Counted&) = delete;

  int* aliveCount;
  std::array<char, Padding> padding{};
};

using Small = Counted<1>;
using Large = Counted<200>;

// Does the callable lie inside of the function?
template <class Function>
bool liesInside(const Function& function, const void* address) {
  const auto* begin = reinterpret_cast<const std::byte*>(&function);
  const auto* at = static_cast<const std::byte*>(address);
  return std::less_equal<>{}(begin, at) && std::less<>{}(at, begin + sizeof function);
}

template <class T>
class QVFunctionCaptureTest : public testing::Test {};
using Captures = testing::Types<Small, Large>;
TYPED_TEST_SUITE(QVFunctionCaptureTest, Captures);

TYPED_TEST(QVFunctionCaptureTest, DestroysWhatItHoldsOnce) {
  int alive = 0;
  {
    QVFunction<int()> function = [counted = TypeParam(alive)] { return *counted.aliveCount; };
    EXPECT_EQ(alive, 1);
    EXPECT_EQ(function(), 1);
  }
  EXPECT_EQ(alive, 0);
}

TYPED_TEST(QVFunctionCaptureTest, MovesWithoutLeavingACopy) {
  int alive = 0;
  QVFunction<int()> first = [counted = TypeParam(alive)] { return *counted.aliveCount; };
  QVFunction<int()> second = std::move(first);
  EXPECT_EQ(alive, 1);
  EXPECT_FALSE(first);  // NOLINT(bugprone-use-after-move): what is left is the point
  EXPECT_EQ(second(), 1);
  first = std::move(second);
  EXPECT_EQ(alive, 1);
  EXPECT_FALSE(second);  // NOLINT(bugprone-use-after-move)
  EXPECT_EQ(first(), 1);
}

TYPED_TEST(QVFunctionCaptureTest, DestroysWhatAnAssignmentReplaces) {
  int replaced = 0;
  int kept = 0;
  QVFunction<int()> function = [counted = TypeParam(replaced)] { return *counted.aliveCount; };
  function = [counted = TypeParam(kept)] { return 10 + *counted.aliveCount; };
  EXPECT_EQ(replaced, 0);
  EXPECT_EQ(kept, 1);
  EXPECT_EQ(function(), 11);
  function = nullptr;
  EXPECT_EQ(kept, 0);
  EXPECT_FALSE(function);
}

TYPED_TEST(QVFunctionCaptureTest, SurvivesAnAssignmentToItself) {
  int alive = 0;
  QVFunction<int()> function = [counted = TypeParam(alive)] { return *counted.aliveCount; };
  QVFunction<int()>& itself = function;
  function = std::move(itself);
  EXPECT_EQ(alive, 1);
  EXPECT_EQ(function(), 1);
}

TYPED_TEST(QVFunctionCaptureTest, MayBeCalledMoreThanOnce) {
  int alive = 0;
  QVFunction<int()> function = [counted = TypeParam(alive), calls = 0]() mutable {
    return ++calls;
  };
  EXPECT_EQ(function(), 1);
  EXPECT_EQ(function(), 2);
  QVFunction<int()> moved = std::move(function);
  EXPECT_EQ(moved(), 3) << "state moves along";
}

TEST(QVFunction, KeepsSmallCapturesInPlaceAndLargeOnesOnTheHeap) {
  std::array<char, 32> fits{};
  std::array<char, 33> exceeds{};
  QVFunction<const void*()> inPlace = [fits]() -> const void* { return fits.data(); };
  QVFunction<const void*()> onHeap = [exceeds]() -> const void* { return exceeds.data(); };
  EXPECT_TRUE(liesInside(inPlace, inPlace()));
  EXPECT_FALSE(liesInside(onHeap, onHeap()));
  QVFunction<const void*(), 48> roomier = [exceeds]() -> const void* { return exceeds.data(); };
  EXPECT_TRUE(liesInside(roomier, roomier()));
}

TEST(QVFunction, IsEmptyWithoutACallable) {
  QVFunction<void()> function;
  EXPECT_FALSE(function);
  EXPECT_FALSE(QVFunction<void()>(nullptr));
  QVFunction<void()> moved = std::move(function);
  EXPECT_FALSE(moved);
  moved = [] {};
  EXPECT_TRUE(moved);
}

TEST(QVFunction, HoldsWhatCannotBeCopied) {
  QVFunction<int()> function = [pointer = std::make_unique<int>(7)] { return *pointer; };
  QVFunction<int()> moved = std::move(function);
  EXPECT_EQ(moved(), 7);
  static_assert(!std::is_copy_constructible_v<QVFunction<int()>>);
  static_assert(std::is_nothrow_move_constructible_v<QVFunction<int()>>);
  static_assert(std::is_nothrow_move_assignable_v<QVFunction<int()>>);
}

TEST(QVFunction, PassesArgumentsOnWithoutCopies) {
  QVFunction<std::string(std::unique_ptr<std::string>, const std::string&)> function =
      [](std::unique_ptr<std::string> own, const std::string& borrowed) { return *own + borrowed; };
  EXPECT_EQ(function(std::make_unique<std::string>("a"), "b"), "ab");
}

TEST(QVFunction, ConvertsTheResult) {
  QVFunction<double()> function = [] { return 3; };
  EXPECT_EQ(function(), 3.0);
  int calls = 0;
  QVFunction<void()> ignoring = [&calls] { return ++calls; };
  ignoring();
  EXPECT_EQ(calls, 1) << "a result that nobody asked for is dropped";
  static_assert(!std::is_constructible_v<QVFunction<int()>, std::string (*)()>);
  static_assert(!std::is_constructible_v<QVFunction<int()>, int (*)(int)>);
}

TEST(QVFunction, ForwardsAnException) {
  QVFunction<void()> function = [] { throw std::string("as it is"); };
  EXPECT_THROW(function(), std::string);
  EXPECT_TRUE(function);
}

TEST(QVFunction, HoldsAnotherFunction) {
  int alive = 0;
  QVFunction<int()> inner = [counted = Small(alive)] { return *counted.aliveCount; };
  QVFunction<int(), 112> outer = [inner = std::move(inner)]() mutable { return inner(); };
  EXPECT_EQ(outer(), 1);
  outer = nullptr;
  EXPECT_EQ(alive, 0);
}

}  // namespace
