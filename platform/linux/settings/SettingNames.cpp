#include "platform/linux/settings/SettingNames.h"

#include "platform/linux/base/Utf8.h"

namespace halvox::platform::linux_ {
namespace {

// File names have at most 255 bytes. The rest is left for an extension and a temporary name.
constexpr std::size_t kLongestName = 200;
constexpr std::size_t kLongestShown = 60;

}  // namespace

bool isUsableName(std::string_view name) {
  return !name.empty() && name != "." && name != ".." && name.size() <= kLongestName &&
         name.find('/') == std::string_view::npos && name.find('\0') == std::string_view::npos;
}

std::string shownName(std::string_view name) {
  std::string shown = "\"";
  const std::size_t taken = appendEscaped(shown, name, kLongestShown);
  return shown + (taken < name.size() ? "…\"" : "\"");
}

}  // namespace halvox::platform::linux_
