#include "platform/linux/drivers/SmallFile.h"

#include <array>
#include <cerrno>

#include <fcntl.h>
#include <unistd.h>

namespace halvox::platform::linux_ {
namespace {

constexpr std::size_t kPieceSize = 16'384;

SmallFile failure(int error) {
  // ENODEV: a file of the kernel whose device has been removed.
  const bool isMissing = error == ENOENT || error == ENOTDIR || error == ENODEV;
  return {isMissing ? SmallFile::Outcome::kMissing : SmallFile::Outcome::kFailed, error};
}

}  // namespace

SmallFile readSmallFile(int directory, const char* name, std::size_t most) {
  struct stat status {};
  // Checked before it is opened, because opening a device can have an effect.
  if (::fstatat(directory, name, &status, 0) != 0) return failure(errno);
  if (!S_ISREG(status.st_mode)) return {SmallFile::Outcome::kNotRegular};
  if (std::cmp_greater(status.st_size, most)) return {SmallFile::Outcome::kTooLarge};

  const UniqueFd file(::openat(directory, name, O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
  if (!file) return failure(errno);
  // Checked again, because another file may have taken its place meanwhile.
  if (::fstat(file.get(), &status) != 0) return failure(errno);
  if (!S_ISREG(status.st_mode)) return {SmallFile::Outcome::kNotRegular};
  SmallFile result{SmallFile::Outcome::kRead};
  std::array<char, kPieceSize> piece;
  while (true) {
    const ssize_t count = ::read(file.get(), piece.data(), piece.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return failure(errno);
    if (count == 0) return result;
    result.text.append(piece.data(), static_cast<std::size_t>(count));
    if (result.text.size() > most) return {SmallFile::Outcome::kTooLarge};
  }
}

UniqueFd openDirectory(const char* path) { return openDirectoryAt(AT_FDCWD, path); }

UniqueFd openDirectoryAt(int directory, const char* name) {
  return UniqueFd(::openat(directory, name, O_RDONLY | O_CLOEXEC | O_DIRECTORY));
}

}  // namespace halvox::platform::linux_
