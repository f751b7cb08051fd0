#pragma once

#include <string>
#include <string_view>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {

// A file that gets its name only when it is complete. Readers therefore never see a part of it.
//
// Until it is complete, the file has no name at all (O_TMPFILE), and the kernel removes it when the
// process ends. On a file system without O_TMPFILE, the file has a temporary name,
// ".halvox-<pid>-<number>.tmp", and a lock. The lock distinguishes it from the files that a killed
// service has left, which finish() deletes.
//
// Belongs to one thread and one owner. Blocks on the disk. Functions return 0 or an errno. After an
// error, only discard() or destruction makes sense.
class UnfinishedFile {
 public:
  enum class Naming : unsigned char { kNoName, kOwnName };

  UnfinishedFile() = default;
  UnfinishedFile(const UnfinishedFile&) = delete;
  UnfinishedFile& operator=(const UnfinishedFile&) = delete;
  // Discards a file that was not finished.
  ~UnfinishedFile() { discard(); }

  // Creates the file. `naming` is for tests; kOwnName uses a temporary name on every file system.
  [[nodiscard]] int begin(UniqueFd directory, Naming naming = Naming::kNoName);
  [[nodiscard]] int write(std::string_view bytes);
  // Syncs the file to the disk, then gives it its name. Replaces an existing file of that name.
  [[nodiscard]] int finish(const std::string& name);
  // Deletes the file unless it was finished. Idempotent.
  void discard();

 private:
  [[nodiscard]] int beginNamed();
  [[nodiscard]] int giveName(const std::string& name);
  void removeLeftOvers() const;

  UniqueFd directory_;
  UniqueFd file_;
  std::string ownName_;  // the temporary name; empty if there is none
};

}  // namespace halvox::platform::linux_
