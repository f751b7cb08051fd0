#pragma once

#include <filesystem>
#include <string>
#include <string_view>

#include <sys/types.h>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::tools {

// A file that gets its name when it is complete: readers see the old file or the whole new one.
// Until then it has a temporary name beside its target. The destructor deletes it unless it was
// kept. Belongs to one thread. The functions return false with errno set.
//
//   write(); keepAs()
class NewFile {
 public:
  explicit NewFile(const std::filesystem::path& target);
  NewFile(const NewFile&) = delete;
  NewFile& operator=(const NewFile&) = delete;
  ~NewFile();

  // Writes the whole text to the disk. A failure to create the file shows here.
  [[nodiscard]] bool write(std::string_view text, mode_t mode);
  // Renames the file to `target` and replaces a file of that name.
  [[nodiscard]] bool keepAs(const std::filesystem::path& target);

 private:
  std::string path_;
  platform::linux_::UniqueFd descriptor_;
  bool isKept_ = false;
};

// The mode of a file that everyone may read, less what the umask forbids. No other thread may
// create files meanwhile.
[[nodiscard]] mode_t modeOfNewFile();

}  // namespace halvox::tools
