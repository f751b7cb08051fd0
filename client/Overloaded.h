#pragma once

namespace halvox::client {

// Joins function objects into one object that std::visit() can call with each alternative of a
// variant.
template <typename... Cases>
struct Overloaded : Cases... {
  using Cases::operator()...;
};
template <typename... Cases>
Overloaded(Cases...) -> Overloaded<Cases...>;

}  // namespace halvox::client
