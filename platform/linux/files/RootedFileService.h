#pragma once

#include <filesystem>

#include "platform/files.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// Directories and files below a root. No symbolic link below the root is followed, so nothing comes
// to lie outside it. Files are written without a name and get it when they are on the disk; a name
// with a slash or NUL, "." and "..", and one that is empty or too long for a file system are
// errors. Any thread may call; blocks for the disk. Counts the files that were begun, written,
// failed and let go.
class RootedFileService final : public FileService {
 public:
  // The statistics must outlive the service, the service its files.
  RootedFileService(std::filesystem::path root, StatisticsService& statistics);

  std::optional<Error> createDirectory(std::string_view path, std::uint32_t permissions) override;
  std::unique_ptr<JsonArrayFile> createJsonArrayFile(std::string_view directory,
                                                     std::string_view name) override;

 private:
  friend class RootedJsonArrayFile;
  struct Counters {
    Counter& begun;
    Counter& written;
    Counter& failed;
    Counter& letGo;
  };

  const std::filesystem::path root_;
  Counters counters_;
};

}  // namespace halvox::platform::linux_
