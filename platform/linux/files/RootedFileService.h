#pragma once

#include <filesystem>

#include "platform/files.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// Creates directories and files below a root directory. Follows no symbolic link below the root,
// and therefore writes nothing outside it. A file gets its name only when its content is on the
// disk.
//
// Any thread may use the service; a file belongs to one thread. Blocks on the disk. Every failure
// is an Error with the path and the system's text. Invalid file names are errors: those that are
// empty, ".", "..", too long, or contain a slash or NUL. Counts the files that were begun, written,
// failed and abandoned.
class RootedFileService final : public FileService {
 public:
  // Does not own `statistics`, which must outlive the service. The service must outlive its files.
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
