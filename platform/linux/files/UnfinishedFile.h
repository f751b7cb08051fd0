#pragma once

#include <string>
#include <string_view>

#include "platform/linux/UniqueHandle.h"

namespace halvox::platform::linux_ {

// A file that has no name yet and gets it when it is finished. Where the file system has no files
// without names it bears one of its own, locked so that nobody takes it for a left-over.
// Belongs to one thread. All results are 0 or the system's error.
class UnfinishedFile {
 public:
  enum class Naming : unsigned char { kNoName, kOwnName };

  UnfinishedFile() = default;
  UnfinishedFile(const UnfinishedFile&) = delete;
  UnfinishedFile& operator=(const UnfinishedFile&) = delete;
  // Leaves nothing of a file that was not finished.
  ~UnfinishedFile() { discard(); }

  [[nodiscard]] int begin(UniqueFd directory, Naming naming = Naming::kNoName);
  [[nodiscard]] int write(std::string_view bytes);
  // Brings the file to the disk, then gives it the name, in the place of a file that has it.
  [[nodiscard]] int finish(const std::string& name);
  void discard();

 private:
  [[nodiscard]] int beginNamed();
  [[nodiscard]] int giveName(const std::string& name);
  void removeLeftOvers() const;

  UniqueFd directory_;
  UniqueFd file_;
  std::string ownName_;  // of a file that has one already
};

}  // namespace halvox::platform::linux_
