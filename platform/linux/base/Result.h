#pragma once

#include <optional>
#include <string>
#include <type_traits>
#include <utility>
#include <variant>

namespace halvox::platform::linux_ {

// Why something could not be done. The caller decides by `code`. `message` is for people, and names
// the object and the system's error ("/etc/x: Permission denied"). If no caller needs a code, Code
// is void and there is only the message.
template <typename Code = void>
struct Failure {
  Code code;
  std::string message;
};
template <>
struct Failure<void> {
  std::string message;
};

// A value, or the reason why there is none. The caller must test which of the two exists before it
// takes one:
//
//   Result<Settings> settings = readSettings(file);
//   if (!settings) return settings.error();
//   use(*settings);
//
// Taking the one that does not exist ends the process. The members are those of std::expected of
// C++23, which can replace this class later. docs/decisions/0009-results.md says why the service
// has a class of its own until then.
template <typename Value, typename Code = void>
class [[nodiscard]] Result {
 public:
  using Error = Failure<Code>;

  // Implicit, so that a function can return its value or its error directly. Also takes anything
  // that converts to a value, such as std::nullopt if the value is a std::optional.
  template <typename Source = Value>
  requires(std::is_convertible_v<Source, Value> &&
           !std::is_same_v<std::remove_cvref_t<Source>, Result> &&
           !std::is_same_v<std::remove_cvref_t<Source>, Error>)
      Result(Source&& value)  // NOLINT(bugprone-forwarding-reference-overload): constrained above
      : state_(std::in_place_index<0>, std::forward<Source>(value)) {}
  Result(Error error) : state_(std::in_place_index<1>, std::move(error)) {}

  [[nodiscard]] bool has_value() const noexcept { return state_.index() == 0; }
  explicit operator bool() const noexcept { return has_value(); }

  [[nodiscard]] Value& operator*() & noexcept { return std::get<0>(state_); }
  [[nodiscard]] const Value& operator*() const& noexcept { return std::get<0>(state_); }
  [[nodiscard]] Value&& operator*() && noexcept { return std::get<0>(std::move(state_)); }
  [[nodiscard]] Value* operator->() noexcept { return &std::get<0>(state_); }
  [[nodiscard]] const Value* operator->() const noexcept { return &std::get<0>(state_); }

  [[nodiscard]] Error& error() & noexcept { return std::get<1>(state_); }
  [[nodiscard]] const Error& error() const& noexcept { return std::get<1>(state_); }
  [[nodiscard]] Error&& error() && noexcept { return std::get<1>(std::move(state_)); }

 private:
  std::variant<Value, Error> state_;
};

// Success without a value, or why something could not be done. `return {};` is success.
template <typename Code>
class [[nodiscard]] Result<void, Code> {
 public:
  using Error = Failure<Code>;

  Result() = default;
  Result(Error error) : error_(std::move(error)) {}

  [[nodiscard]] bool has_value() const noexcept { return !error_.has_value(); }
  explicit operator bool() const noexcept { return has_value(); }

  [[nodiscard]] Error& error() & noexcept { return error_.value(); }
  [[nodiscard]] const Error& error() const& noexcept { return error_.value(); }
  [[nodiscard]] Error&& error() && noexcept { return std::move(error_).value(); }

 private:
  std::optional<Error> error_;
};

}  // namespace halvox::platform::linux_
