#include <array>
#include <memory>
#include <utility>

#include <gtest/gtest.h>

#include "platform/inline_function.h"

namespace halvox::platform {
namespace {

using Function = InlineFunction<int(int), 32>;

TEST(InlineFunctionTest, IsEmptyUntilItGetsAFunction) {
  Function function;
  EXPECT_FALSE(function);
  EXPECT_FALSE(Function(nullptr));

  function = [](int number) { return number + 1; };

  ASSERT_TRUE(function);
  EXPECT_EQ(function(2), 3);
  function = nullptr;
  EXPECT_FALSE(function);
}

TEST(InlineFunctionTest, KeepsItsStateBetweenCalls) {
  Function function = [sum = 0](int number) mutable { return sum += number; };

  EXPECT_EQ(function(1), 1);
  EXPECT_EQ(function(2), 3);
}

TEST(InlineFunctionTest, MovesTheFunctionAndLeavesNone) {
  Function first = [held = std::make_unique<int>(5)](int number) { return *held + number; };

  Function second = std::move(first);
  Function third;
  third = std::move(second);

  EXPECT_FALSE(first);   // NOLINT(bugprone-use-after-move): the state is what is tested
  EXPECT_FALSE(second);  // NOLINT(bugprone-use-after-move): the state is what is tested
  EXPECT_EQ(third(1), 6);
}

TEST(InlineFunctionTest, ReleasesWhatTheFunctionHeldOnce) {
  const auto held = std::make_shared<int>(1);
  const std::array<int, 64> large{};
  {
    Function small = [held](int) { return *held; };
    Function big = [held, large](int index) { return large[static_cast<std::size_t>(index)]; };
    EXPECT_EQ(held.use_count(), 3);
    const Function moved = std::move(big);
    EXPECT_EQ(held.use_count(), 3);
    small = nullptr;
    EXPECT_EQ(held.use_count(), 2);
  }
  EXPECT_EQ(held.use_count(), 1);
}

TEST(InlineFunctionTest, CallsAFunctionThatDoesNotFitInside) {
  std::array<int, 64> large{};
  large[63] = 7;
  Function first = [large](int index) { return large[static_cast<std::size_t>(index)]; };

  Function second = std::move(first);

  EXPECT_EQ(second(63), 7);
}

TEST(InlineFunctionTest, SaysWhatItHoldsInside) {
  const auto text = std::make_shared<std::string>("a");
  const std::string copied = "b";
  const auto fitting = [text = std::shared_ptr(text)](int) { return 1; };
  const auto large = [bytes = std::array<char, 33>{}](int) { return 1 + bytes[0]; };
  // The captured string is const and can only be copied, which may throw.
  const auto constant = [copied](int) { return static_cast<int>(copied.size()); };

  EXPECT_TRUE(Function::holdsInside<decltype(fitting)>());
  EXPECT_FALSE(Function::holdsInside<decltype(large)>());
  EXPECT_FALSE(Function::holdsInside<decltype(constant)>());
}

TEST(InlineFunctionTest, AssignmentReleasesThePreviousFunction) {
  const auto held = std::make_shared<int>(1);
  Function function = [held](int) { return 0; };

  function = Function([](int) { return 1; });

  EXPECT_EQ(held.use_count(), 1);
  EXPECT_EQ(function(0), 1);
}

}  // namespace
}  // namespace halvox::platform
