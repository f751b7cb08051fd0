#include "platform/linux/tracing/lttng/TraceArchive.h"

#include <array>
#include <cerrno>
#include <system_error>

#include <archive.h>
#include <archive_entry.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {
namespace {

using Archive = UniqueHandle<archive*, archive_write_free>;
using Entry = UniqueHandle<archive_entry*, archive_entry_free>;

constexpr mode_t kArchivePermissions = 0600;
constexpr mode_t kFilePermissions = 0644;

Failure<> systemFailure(const std::filesystem::path& path) {
  return {path.string() + ": " + errnoText(errno)};
}

Failure<> archiveFailure(archive* to) {
  const char* const text = archive_error_string(to);
  return {text == nullptr ? "unknown error" : text};
}

Result<void> copy(archive* to, int file, std::uint64_t size, const std::filesystem::path& path) {
  std::array<char, 65'536> buffer;
  while (size > 0) {
    const std::size_t most = std::min<std::uint64_t>(size, buffer.size());
    const ssize_t count = ::read(file, buffer.data(), most);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return systemFailure(path);
    if (count == 0) {
      return Failure<>{path.string() + ": the file became shorter while it was packed"};
    }
    if (archive_write_data(to, buffer.data(), static_cast<std::size_t>(count)) != count) {
      return archiveFailure(to);
    }
    size -= static_cast<std::uint64_t>(count);
  }
  return {};
}

// With O_NOFOLLOW and the check for a regular file, the archive contains only files of the
// recording.
Result<void> addFile(archive* to, const std::filesystem::path& path, const std::string& name) {
  const UniqueFd file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK));
  struct stat status {};
  if (!file || ::fstat(file.get(), &status) != 0) return systemFailure(path);
  if (!S_ISREG(status.st_mode)) return {};
  const Entry entry(archive_entry_new());
  archive_entry_set_pathname(entry.get(), name.c_str());
  archive_entry_set_filetype(entry.get(), AE_IFREG);
  archive_entry_set_perm(entry.get(), kFilePermissions);
  // A file must not change while it is packed, because the format has the size before the content.
  archive_entry_set_size(entry.get(), status.st_size);
  archive_entry_set_mtime(entry.get(), status.st_mtim.tv_sec, 0);
  if (archive_write_header(to, entry.get()) != ARCHIVE_OK) return archiveFailure(to);
  return copy(to, file.get(), static_cast<std::uint64_t>(status.st_size), path);
}

Result<void> write(const std::filesystem::path& directory, int file) {
  const Archive to(archive_write_new());
  if (!to || archive_write_set_format_pax_restricted(to.get()) != ARCHIVE_OK ||
      archive_write_add_filter_zstd(to.get()) != ARCHIVE_OK ||
      archive_write_open_fd(to.get(), file) != ARCHIVE_OK) {
    return to ? archiveFailure(to.get()) : Failure<>{"no memory"};
  }
  std::error_code error;
  std::filesystem::recursive_directory_iterator entry(directory, error);
  for (; !error && entry != std::filesystem::recursive_directory_iterator();
       entry.increment(error)) {
    // Unpacking a file also makes its directories.
    if (entry->is_directory()) continue;
    const std::filesystem::path name =
        directory.filename() / entry->path().lexically_relative(directory);
    if (auto added = addFile(to.get(), entry->path(), name.string()); !added) return added;
  }
  if (error) return Failure<>{directory.string() + ": " + error.message()};
  if (archive_write_close(to.get()) != ARCHIVE_OK) return archiveFailure(to.get());
  return {};
}

}  // namespace

Result<void> packDirectory(const std::filesystem::path& directory,
                           const std::filesystem::path& archive) {
  // The unfinished file is in the scratch directory, where the next start removes what a killed
  // service left.
  const std::filesystem::path unfinished = directory.string() + ".unfinished";
  constexpr int kFlags = O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC | O_NOFOLLOW;
  const UniqueFd file(::open(unfinished.c_str(), kFlags, kArchivePermissions));
  if (!file) return systemFailure(unfinished);
  Result<void> done = write(directory, file.get());
  // Sync before the rename, because after a power cut, an archive that has its name must have its
  // content.
  if (done && ::fsync(file.get()) != 0) done = systemFailure(unfinished);
  if (done && ::rename(unfinished.c_str(), archive.c_str()) != 0) done = systemFailure(archive);
  if (!done) ::unlink(unfinished.c_str());
  return done;
}

}  // namespace halvox::platform::linux_
