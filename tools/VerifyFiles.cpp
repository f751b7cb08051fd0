#include "tools/VerifyFiles.h"

#include <algorithm>
#include <cerrno>
#include <cstddef>
#include <optional>
#include <system_error>

#include "platform/linux/base/ErrnoText.h"
#include "tools/SnapshotReader.h"
#include "tools/SummaryReader.h"

namespace halvox::tools {
namespace {

namespace fs = std::filesystem;
using platform::linux_::Differences;

// The length of the UTC time with which the name of a capture begins: 20260301T120000Z.
constexpr std::size_t kStamp = 16;

std::string stampOf(const fs::path& capture) {
  return capture.filename().native().substr(0, kStamp);
}

// Returns where a capture is: at the recorded path, or in the directory of a store that was moved.
std::optional<fs::path> placeOf(const fs::path& recorded, const fs::path& directory) {
  std::error_code error;
  for (const fs::path& path : {recorded, directory / recorded.filename()}) {
    if (fs::is_regular_file(path, error)) return path;
  }
  return std::nullopt;
}

// Removes "PATH: " from the beginning of a message, because the place of a difference has it too.
std::string withoutPath(const std::string& message, const fs::path& path) {
  const std::string prefix = path.native() + ": ";
  return message.starts_with(prefix) ? message.substr(prefix.size()) : message;
}

}  // namespace

std::uint64_t verifyCaptures(const std::vector<std::string>& recorded, const fs::path& directory,
                             Differences& differences) {
  std::uint64_t read = 0;
  std::vector<fs::path> missing;
  std::optional<std::string> oldest;  // the time of the oldest that exists
  for (const std::string& path : recorded) {
    const auto place = placeOf(path, directory);
    const bool isNewest = &path == &recorded.back();
    if (!place) {
      if (isNewest) differences.add(path, "", "this capture is recorded, but is missing");
      if (!isNewest) missing.emplace_back(path);
      continue;
    }
    // If the clock was set back, the newest looks old. The service keeps it all the same.
    if (!isNewest) oldest = std::min(oldest.value_or(stampOf(*place)), stampOf(*place));
    ++read;
    const auto content = readSnapshotFiles(*place, {});
    if (!content) {
      differences.add(place->native(), "", withoutPath(content.error().message, *place));
    }
  }
  for (const fs::path& path : missing) {
    if (!oldest || stampOf(path) <= *oldest) continue;
    differences.add(path.native(), "",
                    "this capture is recorded, but is missing, although an older one exists");
  }
  return read;
}

std::uint64_t verifySummaries(const fs::path& directory, Differences& differences) {
  std::uint64_t read = 0;
  std::error_code error;
  for (fs::directory_iterator entry(directory, error), end; !error && entry != end;
       entry.increment(error)) {
    const fs::path& path = entry->path();
    if (!parseSummaryName(path.filename().string())) continue;
    ++read;
    const auto totals = readSummary(path.string(), nullptr);
    if (!totals) differences.add(path.native(), "", totals.error().message);
  }
  if (error && error != std::errc::no_such_file_or_directory) {
    differences.add(directory.native(), "", error.message());
  }
  return read;
}

}  // namespace halvox::tools
