#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace halvox::analysis {

// Typed access to the keys of one JSON object, without a copy. The object is parsed at the first
// look-up; a record whose keys nobody asks for costs nothing. What is not a JSON object has no
// keys. Belongs to one thread. Keeps its memory from object to object.
class Payload {
 public:
  Payload();
  Payload(const Payload&) = delete;
  Payload& operator=(const Payload&) = delete;
  ~Payload();

  // Shows another object. `json` must stay valid while this object is used.
  void show(std::string_view json);
  [[nodiscard]] std::string_view json() const { return json_; }

  // The value of a key; nothing if there is no such key or its value has another type. A boolean is
  // a number, 0 or 1. The texts "NaN", "Infinity" and "-Infinity" are not numbers. Views are valid
  // until the next show().
  [[nodiscard]] std::optional<double> number(std::string_view key) const;
  [[nodiscard]] std::optional<std::int64_t> integer(std::string_view key) const;
  [[nodiscard]] std::optional<std::string_view> text(std::string_view key) const;
  [[nodiscard]] bool has(std::string_view key) const;
  // Calls `callback` for each text in the array of the key, in order; other elements are skipped.
  void forEachText(std::string_view key,
                   const std::function<void(std::string_view)>& callback) const;
  // Calls `callback` for each key and its value as JSON text, in order.
  void forEachMember(
      const std::function<void(std::string_view key, std::string_view json)>& callback) const;

 private:
  struct Parsed;
  [[nodiscard]] const Parsed& parsed() const;

  std::string_view json_;  // of the record, which its source owns
  std::unique_ptr<Parsed> parsed_;
};

}  // namespace halvox::analysis
