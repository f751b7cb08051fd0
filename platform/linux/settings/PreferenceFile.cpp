#include "platform/linux/settings/PreferenceFile.h"

#include <array>
#include <cerrno>
#include <limits>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/base/Utf8.h"
#include "platform/linux/configuration/TomlNesting.h"
#include "platform/linux/settings/SettingNames.h"
#include "platform/linux/settings/TomlValues.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::size_t kLongestReason = 400;

PreferenceFileError problem(const std::filesystem::path& file, std::string_view what) {
  PreferenceFileError error;
  appendEscaped(error.description, file.native(), std::numeric_limits<std::size_t>::max());
  appendEscaped(error.description, what, kLongestReason);
  return error;
}

PreferenceFileError problem(const std::filesystem::path& file, int error) {
  return problem(file, ": cannot read the preferences: " + errnoText(error));
}

PreferenceFileError tooLarge(const std::filesystem::path& file, std::size_t size) {
  return problem(file, ": expected at most " + std::to_string(kLargestPreferenceFile) +
                           " bytes, found " +
                           (size == 0 ? std::string("more") : std::to_string(size)));
}

std::variant<std::optional<PreferenceText>, PreferenceFileError> readText(
    const std::filesystem::path& file) {
  // O_NONBLOCK: opening a pipe without a writer would block.
  const UniqueFd descriptor(::open(file.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
  if (!descriptor) {
    if (errno == ENOENT || errno == ENOTDIR) return std::nullopt;
    return problem(file, errno);
  }
  struct stat status {};
  if (::fstat(descriptor.get(), &status) != 0) return problem(file, errno);
  if (!S_ISREG(status.st_mode)) return problem(file, ": expected a regular file");
  if (static_cast<std::size_t>(status.st_size) > kLargestPreferenceFile) {
    return tooLarge(file, static_cast<std::size_t>(status.st_size));
  }
  PreferenceText content{{}, status.st_mode & 07777U};
  std::array<char, 16'384> buffer;
  while (content.text.size() <= kLargestPreferenceFile) {
    const ssize_t count = ::read(descriptor.get(), buffer.data(), buffer.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return problem(file, errno);
    if (count == 0) return content;
    content.text.append(buffer.data(), static_cast<std::size_t>(count));
  }
  return tooLarge(file, 0);  // the file grew after fstat()
}

}  // namespace

std::optional<std::filesystem::path> preferencePath(const std::filesystem::path& directory,
                                                    std::string_view user,
                                                    std::string_view domain) {
  if (!isUsableName(user) || !isUsableName(domain)) return std::nullopt;
  return directory / user / (std::string(domain) + ".toml");
}

std::variant<std::optional<PreferenceText>, PreferenceFileError> readPreferenceText(
    const std::filesystem::path& file) {
  auto content = readText(file);
  const auto* text = std::get_if<std::optional<PreferenceText>>(&content);
  if (text != nullptr && text->has_value() && isNestedTooDeep((*text)->text)) {
    return problem(file, ": expected at most " + std::to_string(kDeepestNesting) +
                             " levels of tables and arrays, found more");
  }
  return content;
}

std::variant<Dictionary, PreferenceFileError> parsePreferences(std::string_view text,
                                                               const std::filesystem::path& file) {
  const toml::parse_result parsed = toml::parse(text);
  if (parsed) return toDictionary(parsed.table());
  const toml::parse_error& error = parsed.error();
  return problem(file, ":" + std::to_string(error.source().begin.line) + ":" +
                           std::to_string(error.source().begin.column) +
                           ": expected TOML, found a mistake: " + std::string(error.description()));
}

std::variant<Dictionary, PreferenceFileError> readPreferences(const std::filesystem::path& file) {
  auto content = readPreferenceText(file);
  if (auto* error = std::get_if<PreferenceFileError>(&content)) return std::move(*error);
  const auto& text = std::get<std::optional<PreferenceText>>(content);
  if (!text.has_value()) return Dictionary();
  return parsePreferences(text->text, file);
}

}  // namespace halvox::platform::linux_
