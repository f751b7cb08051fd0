#pragma once

#include <cstddef>
#include <memory>
#include <new>
#include <type_traits>
#include <utility>

namespace halvox::platform {

template <typename Signature, std::size_t Bytes>
class InlineFunction;

// A function object that can be moved but not copied. Stores a function of up to `Bytes` bytes
// inside itself, and allocates memory for a larger one. std::function stores at most 16 bytes
// inside, which is less than a message and its session take.
//
// Belongs to one thread at a time. Do not call an empty one.
template <typename Result, typename... Arguments, std::size_t Bytes>
class InlineFunction<Result(Arguments...), Bytes> {
 public:
  InlineFunction() noexcept = default;
  InlineFunction(std::nullptr_t) noexcept {}
  template <typename Function>
  requires(!std::is_same_v<std::remove_cvref_t<Function>, InlineFunction> &&
           std::is_invocable_r_v<Result, std::remove_cvref_t<Function>&, Arguments...>)
      // NOLINTNEXTLINE(bugprone-forwarding-reference-overload): the condition excludes this class
      InlineFunction(Function&& function) {
    using Stored = std::remove_cvref_t<Function>;
    if constexpr (fits<Stored>()) {
      new (storage_) Stored(std::forward<Function>(function));
      operations_ = &kOperations<Stored>;
    } else {
      using Owner = OnHeap<Stored>;
      new (storage_) Owner{std::make_unique<Stored>(std::forward<Function>(function))};
      operations_ = &kOperations<Owner>;
    }
  }
  InlineFunction(InlineFunction&& other) noexcept
      : operations_(std::exchange(other.operations_, nullptr)) {
    if (operations_ != nullptr) operations_->move(other.storage_, storage_);
  }
  InlineFunction& operator=(InlineFunction&& other) noexcept {
    if (this == &other) return *this;
    reset();
    operations_ = std::exchange(other.operations_, nullptr);
    if (operations_ != nullptr) operations_->move(other.storage_, storage_);
    return *this;
  }
  InlineFunction(const InlineFunction&) = delete;
  InlineFunction& operator=(const InlineFunction&) = delete;
  ~InlineFunction() { reset(); }

  // True if a function of that type is stored without an allocation. A lambda that captures a const
  // variable by copy may not be: a const member cannot be moved, and copying it may throw.
  template <typename Function>
  [[nodiscard]] static constexpr bool holdsInside() {
    return fits<std::remove_cvref_t<Function>>();
  }

  [[nodiscard]] explicit operator bool() const { return operations_ != nullptr; }
  Result operator()(Arguments... arguments) {
    return operations_->call(storage_, std::forward<Arguments>(arguments)...);
  }

 private:
  template <typename Stored>
  struct OnHeap {
    std::unique_ptr<Stored> stored;
    Result operator()(Arguments... arguments) {
      return (*stored)(std::forward<Arguments>(arguments)...);
    }
  };
  struct Operations {
    Result (*call)(std::byte* function, Arguments&&... arguments);
    void (*move)(std::byte* from, std::byte* to) noexcept;  // `from` is destroyed
    void (*destroy)(std::byte* function) noexcept;
  };

  // A function whose move can throw is allocated: moving the owner must not fail half-way.
  template <typename Stored>
  static constexpr bool fits() {
    return sizeof(Stored) <= Bytes && alignof(Stored) <= alignof(void*) &&
           std::is_nothrow_move_constructible_v<Stored>;
  }
  template <typename Stored>
  static Stored& at(std::byte* storage) {
    return *std::launder(reinterpret_cast<Stored*>(storage));
  }
  template <typename Stored>
  static constexpr Operations kOperations{
      [](std::byte* function, Arguments&&... arguments) -> Result {
        return at<Stored>(function)(std::forward<Arguments>(arguments)...);
      },
      [](std::byte* from, std::byte* to) noexcept {
        new (to) Stored(std::move(at<Stored>(from)));
        at<Stored>(from).~Stored();
      },
      [](std::byte* function) noexcept { at<Stored>(function).~Stored(); }};

  void reset() noexcept {
    if (operations_ != nullptr) std::exchange(operations_, nullptr)->destroy(storage_);
  }

  const Operations* operations_ = nullptr;  // null: empty
  alignas(void*) std::byte storage_[Bytes];
};

}  // namespace halvox::platform
