#include "tools/Notify.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <filesystem>
#include <string>
#include <string_view>
#include <system_error>
#include <variant>

#include <fcntl.h>
#include <sys/stat.h>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/settings/SettingNames.h"
#include "tools/ServiceConfiguration.h"

namespace halvox::tools {

using platform::linux_::Configuration;
using platform::linux_::UniqueFd;

namespace {

// The notifications that the service listens for.
constexpr std::array<std::string_view, 2> kNotifications{
    "com.tarno.halvox.reporting", "com.tarno.pavisk.spatial-audio-accessory-feature.changed"};

}  // namespace

ExitStatus postNotification(const PostNotification& request, OutputForm form, std::ostream& out,
                            std::ostream& errors) {
  const Complaint complain("notify", form, out, errors);
  if (!platform::linux_::isUsableName(request.name)) {
    return complain(ExitStatus::kBadArguments,
                    "NAME: " + platform::linux_::shownName(request.name) +
                        " cannot be a notification; expected the name of a file, without \"/\"");
  }
  // Another file would be harmless, but a mistyped name would look like success.
  if (std::ranges::find(kNotifications, request.name) == kNotifications.end()) {
    return complain(ExitStatus::kBadArguments,
                    "NAME: nothing was posted: the service does not listen for " +
                        platform::linux_::shownName(request.name) + "; expected " +
                        std::string(kNotifications[0]) + " or " + std::string(kNotifications[1]));
  }
  const auto found =
      settingsDirectory(request.directory, &Configuration::notifyDirectory, complain);
  if (const auto* status = std::get_if<ExitStatus>(&found)) return *status;
  const auto& directory = std::get<std::filesystem::path>(found);
  std::error_code error;
  std::filesystem::create_directories(directory, error);
  if (error) {
    return complain(ExitStatus::kCannotWrite, directory.native() + ": " + error.message());
  }
  const std::filesystem::path file = directory / request.name;
  // The open does not block, because the file may be a pipe that nobody reads.
  constexpr int kFlags = O_WRONLY | O_CREAT | O_CLOEXEC | O_NONBLOCK | O_NOCTTY;
  const UniqueFd descriptor(::open(file.c_str(), kFlags, 0644));
  // Touch a file that exists, so that its time is that of the last post.
  if (!descriptor || ::futimens(descriptor.get(), nullptr) != 0) {
    return complain(ExitStatus::kCannotWrite,
                    file.native() + ": " + platform::linux_::errnoText(errno));
  }
  return ExitStatus::kDone;
}

}  // namespace halvox::tools
