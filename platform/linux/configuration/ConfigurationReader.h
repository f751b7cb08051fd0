#pragma once

// Private to the reading of the configuration: tables of a parsed file, key by key.

#define TOML_HEADER_ONLY 0  // the parser is compiled once, in ConfigurationReader.cpp
#define TOML_EXCEPTIONS 0
#include <chrono>
#include <cstdint>
#include <filesystem>
#include <initializer_list>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include <toml++/toml.h>

#include "platform/linux/configuration/Configuration.h"

namespace halvox::platform::linux_ {

// Collects the mistakes of one file and keeps the first in its text.
class ConfigurationMistakes {
 public:
  explicit ConfigurationMistakes(std::string file) : file_(std::move(file)) {}

  // "FILE:LINE:COLUMN: what", made one line.
  void add(const toml::source_position& where, std::string_view what);
  [[nodiscard]] const std::optional<ConfigurationError>& first() const { return first_; }

 private:
  const std::string file_;
  toml::source_position firstPosition_{};
  std::optional<ConfigurationError> first_;
};

struct NumberRange {
  std::uint64_t least;
  std::uint64_t greatest;
};

// One table of the file. Each read names a key, so that in the end the unknown ones are known; it
// leaves `result` alone when the key is absent or its value is not what is expected (a mistake).
class TableReader {
 public:
  // `table` may be null: an absent table, in which no key is found. `name` is empty for the root.
  TableReader(const toml::table* table, std::string name, ConfigurationMistakes& mistakes)
      : table_(table), name_(std::move(name)), mistakes_(mistakes) {}

  [[nodiscard]] TableReader table(std::string_view key);
  void read(std::string_view key, bool& result);
  void read(std::string_view key, std::string& result);  // not empty
  void read(std::string_view key, std::vector<std::string>& result);
  // The same for texts of a form: `matches` tells them, `what` names them to the user. A list has
  // at least one.
  using TextForm = bool (*)(std::string_view);
  void readText(std::string_view key, TextForm matches, std::string_view what, std::string& result);
  void readTexts(std::string_view key, TextForm matches, std::string_view what,
                 std::vector<std::string>& result);
  // An absolute path of at most that many bytes; "~/" is expanded.
  void read(std::string_view key, std::filesystem::path& result, std::size_t longest);
  void read(std::string_view key, NumberRange range, std::uint64_t& result);
  void readSeconds(std::string_view key, std::chrono::milliseconds& result);
  // One of the names; gives its place among them.
  void readChoice(std::string_view key, std::initializer_list<std::string_view> names,
                  std::size_t& result);
  // All keys, whatever they are called, with their values.
  [[nodiscard]] Dictionary readValues();
  [[nodiscard]] std::vector<std::pair<std::string, TableReader>> readTables();
  [[nodiscard]] std::map<std::string, bool, std::less<>> readSwitches();

  [[nodiscard]] bool isPresent() const { return table_ != nullptr; }
  // A mistake of that key, which is present: `what` says what was expected.
  void refuse(std::string_view key, std::string_view what);
  // Reports each key that nobody read.
  void finish();

 private:
  const toml::node* find(std::string_view key);
  [[nodiscard]] std::string fullName(std::string_view key) const;
  void expected(const toml::node& node, std::string_view key, std::string_view what);
  [[nodiscard]] std::optional<Value> toValue(const toml::node& node, const std::string& key);

  const toml::table* table_;
  std::string name_;
  ConfigurationMistakes& mistakes_;
  std::vector<std::string> known_;
};

}  // namespace halvox::platform::linux_
