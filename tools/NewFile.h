#pragma once

#include <cstdint>
#include <filesystem>
#include <string>
#include <string_view>

#include <sys/types.h>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::tools {

// A file that gets its name when it is complete: readers see the old file or the whole new one.
// Until then it has no name if the file system can do that, so that a killed program leaves
// nothing. Otherwise it has a temporary name beside its target, and the destructor deletes it
// unless it was kept. Belongs to one thread. The functions return false with errno set.
//
//   write(), or append() and then complete(); keepAs()
class NewFile {
 public:
  enum class Existing : std::uint8_t { kReplaced, kAnError };

  explicit NewFile(const std::filesystem::path& target);
  NewFile(const NewFile&) = delete;
  NewFile& operator=(const NewFile&) = delete;
  ~NewFile();

  // Appends to the file. A failure to create the file shows here, or in complete().
  [[nodiscard]] bool append(std::string_view text);
  // Sets the mode, and waits until the whole file is on the disk.
  [[nodiscard]] bool complete(mode_t mode);
  // Does both.
  [[nodiscard]] bool write(std::string_view text, mode_t mode);
  // Gives the file its name. If a file of that name exists, replaces it, or fails with EEXIST.
  [[nodiscard]] bool keepAs(const std::filesystem::path& target,
                            Existing existing = Existing::kReplaced);

 private:
  [[nodiscard]] bool isCreated() const;
  [[nodiscard]] bool makeNamed();

  std::string path_;  // the temporary name, once it is used
  platform::linux_::UniqueFd descriptor_;
  bool hasName_ = false;  // the temporary one
  int error_ = 0;         // why there is no file
};

// The mode of a file that everyone may read, less what the umask forbids. No other thread may
// create files meanwhile.
[[nodiscard]] mode_t modeOfNewFile();

}  // namespace halvox::tools
