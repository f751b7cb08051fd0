#include "tools/NewFile.h"

#include <cerrno>
#include <cstddef>
#include <cstdlib>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace halvox::tools {

NewFile::NewFile(const std::filesystem::path& target)
    // In the same directory, because a rename does not cross file systems.
    : path_((target.parent_path() / ("." + target.filename().native() + ".XXXXXX")).native()),
      descriptor_(::mkostemp(path_.data(), O_CLOEXEC)) {}

NewFile::~NewFile() {
  if (descriptor_ && !isKept_) ::unlink(path_.c_str());
}

bool NewFile::write(std::string_view text, mode_t mode) {
  if (!descriptor_ || ::fchmod(descriptor_.get(), mode) != 0) return false;
  while (!text.empty()) {
    const ssize_t count = ::write(descriptor_.get(), text.data(), text.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return false;
    text.remove_prefix(static_cast<std::size_t>(count));
  }
  // Without this fsync(), a crash after the rename could leave an empty file.
  return ::fsync(descriptor_.get()) == 0;
}

bool NewFile::keepAs(const std::filesystem::path& target) {
  isKept_ = ::rename(path_.c_str(), target.c_str()) == 0;
  return isKept_;
}

mode_t modeOfNewFile() {
  constexpr mode_t kReadableByAll = 0644;
  // The mask cannot be read without setting it: no other thread may create a file meanwhile.
  const mode_t mask = ::umask(0);
  ::umask(mask);
  return kReadableByAll & ~mask;
}

}  // namespace halvox::tools
