#include "platform/linux/diagnostics/SnapshotArchive.h"

#include <algorithm>
#include <cerrno>
#include <ctime>

#include <archive.h>
#include <archive_entry.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/diagnostics/BoundedFile.h"

namespace halvox::platform::linux_ {
namespace {

using Entry = UniqueHandle<archive_entry*, archive_entry_free>;

constexpr mode_t kMode = 0600;

}  // namespace

// libarchive leaks memory once its output has failed. The write callback therefore never fails: it
// remembers the first error and discards later bytes. SnapshotArchive tests the error after each
// step.
struct SnapshotArchive::Writer {
  UniqueFd file;
  int error = 0;  // the first one
  bool isDiscarding = false;
  UniqueHandle<struct archive*, archive_write_free> handle;

  static la_ssize_t write(struct archive* /*handle*/, void* context, const void* bytes,
                          std::size_t size) {
    static_cast<Writer*>(context)->write({static_cast<const char*>(bytes), size});
    return static_cast<la_ssize_t>(size);
  }
  void write(std::string_view bytes) {
    while (!bytes.empty() && !isDiscarding) {
      const ssize_t written = ::write(file.get(), bytes.data(), bytes.size());
      if (written >= 0) {
        bytes.remove_prefix(static_cast<std::size_t>(written));
      } else if (errno != EINTR) {
        error = errno;
        isDiscarding = true;
      }
    }
  }
};

SnapshotArchive::SnapshotArchive(std::filesystem::path temporaryPath, std::uint64_t mostBytes)
    : path_(std::move(temporaryPath)), writer_(std::make_unique<Writer>()), room_(mostBytes) {}

SnapshotArchive::~SnapshotArchive() {
  // Freeing an unfinished archive writes its remaining bytes. Discard them.
  writer_->isDiscarding = true;
  writer_->handle.reset();
  if (isCreated_ && !isKept_) ::unlink(path_.c_str());
}

Result<void> SnapshotArchive::open() {
  // Remove the file that a killed service left. O_EXCL then ensures that the new file is ours.
  ::unlink(path_.c_str());
  writer_->file.reset(
      ::open(path_.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC | O_NOFOLLOW, kMode));
  if (!writer_->file) return Failure<>{path_.native() + ": " + errnoText(errno)};
  isCreated_ = true;
  writer_->handle.reset(archive_write_new());
  archive* const out = writer_->handle.get();
  if (archive_write_set_format_pax_restricted(out) != ARCHIVE_OK ||
      archive_write_add_filter_zstd(out) != ARCHIVE_OK ||
      archive_write_set_bytes_in_last_block(out, 1) != ARCHIVE_OK ||
      archive_write_open(out, writer_.get(), nullptr, Writer::write, nullptr) != ARCHIVE_OK) {
    return failed();
  }
  return written();
}

Result<void> SnapshotArchive::add(const std::string& name, std::string_view bytes) {
  const Entry entry(archive_entry_new());
  archive_entry_set_pathname(entry.get(), name.c_str());
  archive_entry_set_filetype(entry.get(), AE_IFREG);
  archive_entry_set_perm(entry.get(), kMode);
  archive_entry_set_size(entry.get(), static_cast<la_int64_t>(bytes.size()));
  archive_entry_set_mtime(entry.get(), std::time(nullptr), 0);
  archive* const out = writer_->handle.get();
  if (archive_write_header(out, entry.get()) != ARCHIVE_OK) return failed();
  if (archive_write_data(out, bytes.data(), bytes.size()) !=
      static_cast<la_ssize_t>(bytes.size())) {
    return failed();
  }
  room_ -= std::min<std::uint64_t>(room_, bytes.size());
  return written();
}

Result<void> SnapshotArchive::finish() {
  if (archive_write_close(writer_->handle.get()) != ARCHIVE_OK) return failed();
  writer_->handle.reset();
  if (auto done = written(); !done) return done;
  struct stat status {};
  // Sync before the archive gets its name, because after a power cut, an archive with a name must
  // be complete.
  if (::fsync(writer_->file.get()) != 0 || ::fstat(writer_->file.get(), &status) != 0) {
    return Failure<>{path_.native() + ": " + errnoText(errno)};
  }
  size_ = static_cast<std::uint64_t>(status.st_size);
  return {};
}

Result<void> SnapshotArchive::written() const {
  if (writer_->error == 0) return {};
  return Failure<>{path_.native() + ": " + errnoText(writer_->error)};
}

Failure<> SnapshotArchive::failed() const {
  if (auto done = written(); !done) return std::move(done).error();
  const int error = archive_errno(writer_->handle.get());
  const char* text = archive_error_string(writer_->handle.get());
  // A positive number is an errno; libarchive's own codes are negative.
  if (error > 0) return {path_.native() + ": " + errnoText(error)};
  return {path_.native() + ": " + (text == nullptr ? "cannot write the archive" : text)};
}

}  // namespace halvox::platform::linux_
