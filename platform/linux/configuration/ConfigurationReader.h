#pragma once

// Private to Configuration.cpp: reads the tables of a parsed file key by key. toml++ is included
// here and not in Configuration.h, because toml++ is large.

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

// Receives the mistakes of one file and keeps the one that comes first in the text, whatever the
// order of the checks, because users fix a file from the top.
class ConfigurationMistakes {
 public:
  explicit ConfigurationMistakes(std::string file) : file_(std::move(file)) {}

  // Adds the mistake "FILE:LINE:COLUMN: what". Escapes control characters, because the error must
  // stay on one line.
  void add(const toml::source_position& where, std::string_view what);
  [[nodiscard]] const std::optional<Failure<ConfigurationError>>& first() const { return first_; }

 private:
  const std::string file_;
  toml::source_position firstPosition_{};
  std::optional<Failure<ConfigurationError>> first_;
};

struct NumberRange {
  std::uint64_t least;
  std::uint64_t greatest;
};

// One table of the file. Remembers the keys that were read, so that finish() can report the others.
// Before a read, `result` holds the default. The read leaves `result` unchanged if the key is
// absent or the value is not as expected. In the second case the read also adds a mistake. Refers
// to the parsed file and to `mistakes`, which must outlive it. Belongs to one thread.
class TableReader {
 public:
  // `table` is null for a table that the file does not have. `name` is empty for the root.
  TableReader(const toml::table* table, std::string name, ConfigurationMistakes& mistakes)
      : table_(table), name_(std::move(name)), mistakes_(mistakes) {}

  [[nodiscard]] TableReader table(std::string_view key);
  void read(std::string_view key, bool& result);
  void read(std::string_view key, std::string& result);  // not empty
  void read(std::string_view key, std::vector<std::string>& result);
  // Reads one text, or a list of at least one text. Each text must satisfy `matches`. `what`
  // describes to the user what is expected.
  using TextForm = bool (*)(std::string_view);
  void readText(std::string_view key, TextForm matches, std::string_view what, std::string& result);
  void readTexts(std::string_view key, TextForm matches, std::string_view what,
                 std::vector<std::string>& result);
  // Reads a list of at least one pattern for fnmatch(3). A mistake in a pattern is named.
  void readPatterns(std::string_view key, std::string_view what, std::vector<std::string>& result);
  // Reads an absolute path of at most `longest` bytes; expands "~/".
  void read(std::string_view key, std::filesystem::path& result, std::size_t longest);
  void read(std::string_view key, NumberRange range, std::uint64_t& result);
  void readSeconds(std::string_view key, std::chrono::milliseconds& result);
  // Reads one of `names`; `result` becomes its index.
  void readChoice(std::string_view key, std::initializer_list<std::string_view> names,
                  std::size_t& result);
  // Reads all keys, whatever their names.
  [[nodiscard]] Dictionary readValues();
  [[nodiscard]] std::vector<std::pair<std::string, TableReader>> readTables();
  [[nodiscard]] std::map<std::string, bool, std::less<>> readSwitches();

  [[nodiscard]] bool isPresent() const { return table_ != nullptr; }
  // Adds a mistake for `key` if the file has it; `what` describes what was expected.
  void refuse(std::string_view key, std::string_view what);
  // Adds a mistake for each key that was not read. Call it last.
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
