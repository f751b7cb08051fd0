#include "tools/NewFile.h"

#include <cerrno>
#include <cstddef>
#include <cstdio>
#include <cstdlib>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace halvox::tools {
namespace {

constexpr mode_t kOwnerOnly = 0600;

// Where the kernel shows an open file. A file without a name can be linked only by this path.
std::string linkOf(int descriptor) { return "/proc/self/fd/" + std::to_string(descriptor); }

std::string directoryOf(const std::filesystem::path& target) {
  return target.has_parent_path() ? target.parent_path().native() : ".";
}

}  // namespace

NewFile::NewFile(const std::filesystem::path& target)
    // In the same directory, because a rename does not cross file systems.
    : path_((target.parent_path() / ("." + target.filename().native() + ".XXXXXX")).native()),
      descriptor_(::open(directoryOf(target).c_str(), O_TMPFILE | O_RDWR | O_CLOEXEC, kOwnerOnly)) {
  // Without /proc the file could never get its name.
  if (descriptor_ && ::access(linkOf(descriptor_.get()).c_str(), F_OK) == 0) return;
  // Not every file system can create a file without a name.
  descriptor_.reset(::mkostemp(path_.data(), O_CLOEXEC));
  hasName_ = static_cast<bool>(descriptor_);
  if (!hasName_) error_ = errno;
}

NewFile::~NewFile() {
  if (hasName_) ::unlink(path_.c_str());
}

// If the file could not be created, sets errno to the reason and returns false.
bool NewFile::isCreated() const {
  if (!descriptor_) errno = error_;
  return static_cast<bool>(descriptor_);
}

bool NewFile::append(std::string_view text) {
  if (!isCreated()) return false;
  while (!text.empty()) {
    const ssize_t count = ::write(descriptor_.get(), text.data(), text.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return false;
    text.remove_prefix(static_cast<std::size_t>(count));
  }
  return true;
}

bool NewFile::complete(mode_t mode) {
  // Without this fsync(), a crash after the rename could leave an empty file.
  return isCreated() && ::fchmod(descriptor_.get(), mode) == 0 && ::fsync(descriptor_.get()) == 0;
}

bool NewFile::write(std::string_view text, mode_t mode) { return append(text) && complete(mode); }

// Gives a file without a name a temporary one.
bool NewFile::makeNamed() {
  if (hasName_) return true;
  // mkostemp() finds a name that is free. linkat() needs the name itself, and does not replace.
  const platform::linux_::UniqueFd placeholder(::mkostemp(path_.data(), O_CLOEXEC));
  if (!placeholder || ::unlink(path_.c_str()) != 0) return false;
  hasName_ = ::linkat(AT_FDCWD, linkOf(descriptor_.get()).c_str(), AT_FDCWD, path_.c_str(),
                      AT_SYMLINK_FOLLOW) == 0;
  return hasName_;
}

bool NewFile::keepAs(const std::filesystem::path& target, Existing existing) {
  // Neither call replaces a file that another program has created meanwhile. File systems that
  // cannot create a file without a name often cannot link either.
  if (existing == Existing::kAnError && !hasName_) {
    return ::linkat(AT_FDCWD, linkOf(descriptor_.get()).c_str(), AT_FDCWD, target.c_str(),
                    AT_SYMLINK_FOLLOW) == 0;
  }
  if (existing == Existing::kAnError) {
    hasName_ =
        ::renameat2(AT_FDCWD, path_.c_str(), AT_FDCWD, target.c_str(), RENAME_NOREPLACE) != 0;
    return !hasName_;
  }
  if (!makeNamed() || ::rename(path_.c_str(), target.c_str()) != 0) return false;
  hasName_ = false;
  return true;
}

mode_t modeOfNewFile() {
  constexpr mode_t kReadableByAll = 0644;
  // The mask cannot be read without setting it: no other thread may create a file meanwhile.
  const mode_t mask = ::umask(0);
  ::umask(mask);
  return kReadableByAll & ~mask;
}

}  // namespace halvox::tools
