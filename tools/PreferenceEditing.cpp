#include "tools/PreferenceEditing.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <optional>
#include <utility>

#include "platform/linux/base/Utf8.h"
#include "platform/linux/configuration/TomlTrouble.h"
#include "platform/linux/settings/SettingNames.h"
#include "platform/linux/settings/TomlValues.h"

namespace halvox::tools {
namespace {

using platform::Dictionary;
using platform::Value;
using platform::linux_::appendEscaped;
using platform::linux_::Failure;
using platform::linux_::findTomlTrouble;
using platform::linux_::isUtf8;
using platform::linux_::kLargestPreferenceFile;
using platform::linux_::nextUtf8;
using platform::linux_::parsePreferences;
using platform::linux_::Result;
using platform::linux_::shownName;
using platform::linux_::toDictionary;
using platform::linux_::toValue;

using Edited = Result<std::string>;

// Returns a text as a TOML string on one line.
std::string quotedText(std::string_view text) {
  std::string quoted = "\"";
  for (const char character : text) {
    const auto byte = static_cast<unsigned char>(character);
    if (character == '"' || character == '\\') {
      quoted += '\\';
      quoted += character;
    } else if (byte < 0x20 || byte == 0x7F) {
      // TOML does not allow these characters in a string, except for the tab.
      std::array<char, 8> escape{};
      std::snprintf(escape.data(), escape.size(), "\\u%04X", unsigned{byte});
      quoted += escape.data();
    } else {
      quoted += character;
    }
  }
  return quoted + '"';
}

std::string keyText(std::string_view key) {
  // Other keys need quotes. A dot, for example, would make tables of the parts.
  const bool isBare = !key.empty() && std::ranges::all_of(key, [](char letter) {
    return (letter >= 'a' && letter <= 'z') || (letter >= 'A' && letter <= 'Z') ||
           (letter >= '0' && letter <= '9') || letter == '-' || letter == '_';
  });
  return isBare ? std::string(key) : quotedText(key);
}

// Converts a position of the parser, which counts lines and characters from 1, to a byte offset.
std::size_t offsetOf(std::string_view text, toml::source_position position) {
  std::size_t offset = 0;
  // The parser does not count a byte order mark.
  if (text.starts_with("\xEF\xBB\xBF")) offset = 3;
  for (toml::source_index line = 1; line < position.line; ++line) {
    const std::size_t end = text.find('\n', offset);
    if (end == std::string_view::npos) return text.size();
    offset = end + 1;
  }
  for (toml::source_index column = 1; column < position.column && offset < text.size(); ++column) {
    offset += nextUtf8(text.substr(offset)).length;
  }
  return std::min(offset, text.size());
}

std::size_t lineStart(std::string_view text, std::size_t offset) {
  const std::size_t end = offset == 0 ? std::string_view::npos : text.rfind('\n', offset - 1);
  return end == std::string_view::npos ? 0 : end + 1;
}

std::size_t lineEnd(std::string_view text, std::size_t offset) {
  const std::size_t end = text.find('\n', offset);
  return end == std::string_view::npos ? text.size() : end + 1;
}

// Returns true for a value that is written as "key = value". Tables may also be written with
// headers or dotted keys; changing those would need more than the lines of the key.
bool followsItsKey(const toml::node& node) {
  const toml::table* table = node.as_table();
  if (table != nullptr) return table->is_inline();
  const toml::array* array = node.as_array();
  return array == nullptr || !array->is_array_of_tables() ||
         (!array->empty() && array->get(0)->as_table()->is_inline());
}

// The text of a file and its parse result.
class ParsedText {
 public:
  ParsedText(std::string_view text, const std::filesystem::path& file)
      : text_(text),
        file_(file),
        parsed_(toml::parse(findTomlTrouble(text).has_value() ? kNotToml : text)) {}

  [[nodiscard]] bool isValid() const { return static_cast<bool>(parsed_); }
  [[nodiscard]] const toml::table& root() const { return parsed_.table(); }
  [[nodiscard]] Failure<> mistake() const { return parsePreferences(text_, file_).error(); }
  [[nodiscard]] Failure<> refusal(std::string_view key) const {
    Failure<> error;
    appendEscaped(error.message, file_.native(), 4096);
    error.message += ": " + shownName(key) +
                     " is a table, or cannot be changed alone where it is; expected KEY = VALUE "
                     "on its own lines; edit the file instead";
    return error;
  }
  [[nodiscard]] std::size_t begin(const toml::node& node) const {
    return offsetOf(text_, node.source().begin);
  }
  [[nodiscard]] std::size_t end(const toml::node& node) const {
    return offsetOf(text_, node.source().end);
  }

  // The offset for a new top-level key: after the last one, else before the first table. After a
  // table header it would belong to that table.
  [[nodiscard]] std::size_t placeForNewKey() const {
    std::size_t afterKeys = 0;
    std::size_t firstTable = text_.size();
    for (const auto& [key, node] : root()) {
      if (followsItsKey(node)) {
        afterKeys = std::max(afterKeys, lineEnd(text_, end(node)));
      } else {
        firstTable = std::min(firstTable, lineStart(text_, offsetOf(text_, key.source().begin)));
      }
    }
    return afterKeys > 0 ? afterKeys : firstTable;
  }

 private:
  // Stands for a text that toml++ must not be given.
  static constexpr std::string_view kNotToml = "=";

  std::string_view text_;  // owned by the caller
  const std::filesystem::path& file_;
  toml::parse_result parsed_;
};

// Returns the edited text if it has the expected values, else an error.
Edited verified(std::string text, const Dictionary& expected, const ParsedText& before,
                std::string_view key, const std::filesystem::path& file) {
  const auto after = parsePreferences(text, file);
  // The text was edited by positions. Only reading it again shows that nothing else has changed its
  // meaning.
  if (!after || *after != expected) return before.refusal(key);
  if (text.size() > kLargestPreferenceFile) {
    return Failure<>{file.native() + ": expected at most " +
                     std::to_string(kLargestPreferenceFile) + " bytes, would have " +
                     std::to_string(text.size())};
  }
  return text;
}

std::string withNewLine(std::string_view text, std::size_t place, const std::string& line) {
  std::string edited(text.substr(0, place));
  if (!edited.empty() && !edited.ends_with('\n')) edited += '\n';
  edited += line;
  edited += '\n';
  return edited.append(text.substr(place));
}

}  // namespace

Result<PreferenceValue> parsePreferenceValue(std::string_view text, ValueForm form) {
  if (!isUtf8(text)) return Failure<>{"VALUE: expected UTF-8 text, found other bytes"};
  if (form == ValueForm::kTomlOrString && !findTomlTrouble(text).has_value()) {
    constexpr std::string_view kKey = "v = ";
    const std::string line = std::string(kKey) + std::string(text);
    const toml::parse_result parsed = toml::parse(line);
    // Text that contains a comment, or more than one value, is a string that looks like TOML.
    if (parsed && parsed.table().size() == 1 && followsItsKey(*parsed.table().get("v")) &&
        offsetOf(line, parsed.table().get("v")->source().end) == line.size()) {
      return PreferenceValue{std::string(text), toValue(*parsed.table().get("v"))};
    }
  }
  return PreferenceValue{quotedText(text), Value(text)};
}

Edited withPreference(std::string_view text, std::string_view key, const PreferenceValue& value,
                      const std::filesystem::path& file) {
  const ParsedText parsed(text, file);
  if (!parsed.isValid()) return parsed.mistake();
  Dictionary expected = toDictionary(parsed.root());
  expected.set(key, value.value);
  std::string edited;
  if (const toml::node* old = parsed.root().get(key)) {
    if (!followsItsKey(*old)) return parsed.refusal(key);
    edited = std::string(text.substr(0, parsed.begin(*old))) + value.text;
    edited += text.substr(parsed.end(*old));
  } else {
    edited = withNewLine(text, parsed.placeForNewKey(), keyText(key) + " = " + value.text);
  }
  return verified(std::move(edited), expected, parsed, key, file);
}

Edited withoutPreference(std::string_view text, std::string_view key,
                         const std::filesystem::path& file) {
  const ParsedText parsed(text, file);
  if (!parsed.isValid()) return parsed.mistake();
  const toml::node* old = parsed.root().get(key);
  if (old == nullptr) return std::string(text);
  if (!followsItsKey(*old)) return parsed.refusal(key);
  Dictionary expected = toDictionary(parsed.root());
  expected.remove(key);
  const std::size_t place = parsed.root().find(key)->first.source().begin
                                ? offsetOf(text, parsed.root().find(key)->first.source().begin)
                                : parsed.begin(*old);
  // Whole lines are removed: a comment on the line of the value belongs to the value.
  std::string edited(text.substr(0, lineStart(text, place)));
  edited += text.substr(lineEnd(text, parsed.end(*old)));
  return verified(std::move(edited), expected, parsed, key, file);
}

}  // namespace halvox::tools
