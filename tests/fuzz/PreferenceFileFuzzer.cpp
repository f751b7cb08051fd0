// Edits arbitrary bytes as a preference file: the first line is a key, the second a value, the rest
// is the file. An edit that succeeds changes the meaning of that key and of nothing else.

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/linux/settings/PreferenceFile.h"
#include "platform/value.h"
#include "tests/fuzz/InputFile.h"
#include "tools/PreferenceEditing.h"

namespace {

using namespace halvox;
using fuzzing::require;
using platform::linux_::parsePreferences;

constexpr const char* kFile = "/preferences.toml";

std::string_view takeLine(std::string_view& text) {
  const std::size_t end = text.find('\n');
  const std::string_view line = text.substr(0, end);
  text = end == std::string_view::npos ? std::string_view() : text.substr(end + 1);
  return line;
}

// Whether both have the same keys and values, except for that key.
bool agreeExceptFor(std::string_view key, const platform::Dictionary& one,
                    const platform::Dictionary& other) {
  for (const auto& [name, value] : one) {
    if (name != key && (other.find(name) == nullptr || *other.find(name) != value)) return false;
  }
  return true;
}

void checkEdits(std::string_view key, std::string_view newValue, std::string_view text) {
  const auto before = parsePreferences(text, kFile);
  if (!before) {
    require(!before.error().message.empty());
    require(before.error().message.find('\n') == std::string::npos);
  }
  const auto value = tools::parsePreferenceValue(newValue, tools::ValueForm::kTomlOrString);
  if (!value) return;
  if (const auto changed = tools::withPreference(text, key, *value, kFile)) {
    const auto after = parsePreferences(*changed, kFile);
    require(before.has_value() && after.has_value());
    require(after->find(key) != nullptr && *after->find(key) == value->value);
    require(agreeExceptFor(key, *before, *after) && agreeExceptFor(key, *after, *before));
  }
  if (const auto removed = tools::withoutPreference(text, key, kFile)) {
    const auto after = parsePreferences(*removed, kFile);
    require(before.has_value() && after.has_value());
    require(after->find(key) == nullptr);
    require(agreeExceptFor(key, *before, *after) && agreeExceptFor(key, *after, *before));
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string bytes(reinterpret_cast<const char*>(data), size);
  std::string_view text = bytes;
  const std::string_view key = takeLine(text);
  const std::string_view value = takeLine(text);
  checkEdits(key, value, text);
  return 0;
}
