#include "platform/linux/settings/PreferenceFile.h"

#include <cstdint>
#include <limits>
#include <utility>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/base/Utf8.h"
#include "platform/linux/base/WholeFile.h"
#include "platform/linux/configuration/TomlTrouble.h"
#include "platform/linux/settings/SettingNames.h"
#include "platform/linux/settings/TomlValues.h"

namespace halvox::platform::linux_ {
namespace {

// The reason is bounded, because the parser quotes the file in its error messages and anyone may
// have written the file.
constexpr std::size_t kLongestReason = 400;

Failure<> problem(const std::filesystem::path& file, std::string_view what) {
  Failure<> error;
  // Do not cut the path, because the user needs all of it to find the file.
  appendEscaped(error.message, file.native(), std::numeric_limits<std::size_t>::max());
  appendEscaped(error.message, what, kLongestReason);
  return error;
}

Failure<> problem(const std::filesystem::path& file, int error) {
  return problem(file, ": cannot read the preferences: " + errnoText(error));
}

Failure<> problem(const std::filesystem::path& file, const TomlTrouble& trouble) {
  return problem(file, ":" + std::to_string(trouble.line) + ":1: " + trouble.description());
}

// `size` may be less than the limit if the file grew after its size was read.
Failure<> tooLarge(const std::filesystem::path& file, std::uint64_t size) {
  return problem(file,
                 ": expected at most " + std::to_string(kLargestPreferenceFile) + " bytes, found " +
                     (size <= kLargestPreferenceFile ? std::string("more") : std::to_string(size)));
}

Result<std::optional<PreferenceText>> readText(const std::filesystem::path& file) {
  FileContent content = readWholeFile({.path = file.c_str(), .most = kLargestPreferenceFile});
  switch (content.outcome) {
    case FileContent::Outcome::kRead:
      return PreferenceText{std::move(content.bytes), content.mode & 07777U};
    case FileContent::Outcome::kMissing:
      return std::nullopt;
    case FileContent::Outcome::kNotRegular:
      return problem(file, ": expected a regular file");
    case FileContent::Outcome::kTooLarge:
      return tooLarge(file, content.size);
    case FileContent::Outcome::kFailed:
      break;
  }
  return problem(file, content.error);
}

}  // namespace

std::optional<std::filesystem::path> preferencePath(const std::filesystem::path& directory,
                                                    std::string_view user,
                                                    std::string_view domain) {
  if (!isUsableName(user) || !isUsableName(domain)) return std::nullopt;
  return directory / user / (std::string(domain) + ".toml");
}

Result<std::optional<PreferenceText>> readPreferenceText(const std::filesystem::path& file) {
  auto content = readText(file);
  if (content && content->has_value()) {
    if (const auto trouble = findTomlTrouble((*content)->text)) return problem(file, *trouble);
  }
  return content;
}

Result<Dictionary> parsePreferences(std::string_view text, const std::filesystem::path& file) {
  if (const auto trouble = findTomlTrouble(text)) return problem(file, *trouble);
  const toml::parse_result parsed = toml::parse(text);
  if (parsed) return toDictionary(parsed.table());
  const toml::parse_error& error = parsed.error();
  return problem(file, ":" + std::to_string(error.source().begin.line) + ":" +
                           std::to_string(error.source().begin.column) +
                           ": expected TOML, found a mistake: " + std::string(error.description()));
}

Result<Dictionary> readPreferences(const std::filesystem::path& file) {
  auto content = readPreferenceText(file);
  if (!content) return std::move(content).error();
  const std::optional<PreferenceText>& text = *content;
  if (!text.has_value()) return Dictionary();
  return parsePreferences(text->text, file);
}

}  // namespace halvox::platform::linux_
