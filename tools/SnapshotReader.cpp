#include "tools/SnapshotReader.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <string_view>
#include <system_error>

#include <archive.h>
#include <archive_entry.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/base/UniqueHandle.h"

namespace halvox::tools {
namespace {

namespace fs = std::filesystem;

using platform::linux_::errnoText;
using platform::linux_::Failure;
using platform::linux_::Result;
using platform::linux_::UniqueFd;
using platform::linux_::UniqueHandle;

using Reader = UniqueHandle<archive*, archive_read_free>;
using DiskWriter = UniqueHandle<archive*, archive_write_free>;

constexpr std::size_t kBlock = 64U << 10U;
// Above what the service writes, which is 64 MiB before compression by default.
constexpr std::uint64_t kMostBytes = 256U << 20U;
constexpr std::size_t kMostEntries = 10'000;
// Only the signature and the manifest are read as text.
constexpr std::size_t kMostBytesOfText = 16U << 20U;
constexpr const char* kTooLarge = "the archive is too large when unpacked";
// libarchive's code for a file of another format. Its system text ("Invalid or incomplete multibyte
// or wide character") would mislead.
constexpr int kUnknownFormat = EILSEQ;

Failure<> failed(const fs::path& snapshot, const std::string& why) {
  return {snapshot.native() + ": " + why};
}

std::string textOf(archive* handle) {
  const char* text = archive_error_string(handle);
  return text == nullptr ? "cannot read the archive" : text;
}

// One pass over the entries of an archive. Validates each entry before it is returned.
class Walk {
 public:
  explicit Walk(const fs::path& snapshot) : snapshot_(snapshot), reader_(archive_read_new()) {}

  [[nodiscard]] Result<void> open() {
    // Opening a pipe would block until somebody writes to it, and libarchive takes an empty name
    // for the standard input.
    struct stat status {};
    if (::stat(snapshot_.c_str(), &status) != 0) return failed(snapshot_, errnoText(errno));
    if (!S_ISREG(status.st_mode)) {
      return failed(snapshot_, S_ISDIR(status.st_mode)
                                   ? errnoText(EISDIR)
                                   : "expected a snapshot, found a special file");
    }
    archive_read_support_format_tar(reader_.get());
    archive_read_support_filter_zstd(reader_.get());
    if (archive_read_open_filename(reader_.get(), snapshot_.c_str(), kBlock) == ARCHIVE_OK) {
      return {};
    }
    const int error = archive_errno(reader_.get());
    if (error == kUnknownFormat) return failed(snapshot_, "not a snapshot: unknown file format");
    return failed(snapshot_, error > 0 ? errnoText(error) : textOf(reader_.get()));
  }

  // Returns the next entry, null at the end of the archive, or an error.
  [[nodiscard]] Result<archive_entry*> next() {
    archive_entry* entry = nullptr;
    const int result = archive_read_next_header(reader_.get(), &entry);
    if (result == ARCHIVE_EOF) return nullptr;
    if (result != ARCHIVE_OK) return failed(snapshot_, textOf(reader_.get()));
    if (++entries_ > kMostEntries) return failed(snapshot_, "the archive has too many files");
    // Skipping an entry decompresses it too. Therefore the sizes in the headers are tested first.
    // Each size is bounded, so that one of nearly 2^64 cannot make the sum wrap.
    announced_ += std::min(static_cast<std::uint64_t>(archive_entry_size(entry)), kMostBytes + 1);
    if (announced_ > kMostBytes) return failed(snapshot_, kTooLarge);
    const char* name = archive_entry_pathname(entry);
    const auto type = archive_entry_filetype(entry);
    // The service packs only files and directories. A link in an archive could lead out of the
    // directory.
    if (name == nullptr || archive_entry_hardlink(entry) != nullptr ||
        (type != AE_IFREG && type != AE_IFDIR) || leadsOut(name)) {
      return failed(
          snapshot_,
          "not a snapshot: expected only plain files and directories with relative names");
    }
    return entry;
  }

  // Returns the next piece of the current entry, an empty one at its end, or an error.
  [[nodiscard]] Result<std::string_view> nextPiece() {
    const la_ssize_t count = archive_read_data(reader_.get(), buffer_.data(), buffer_.size());
    if (count < 0) return failed(snapshot_, textOf(reader_.get()));
    // The unpacked bytes are counted too, because the size in a header need not be true.
    bytes_ += static_cast<std::uint64_t>(count);
    if (bytes_ > kMostBytes) return failed(snapshot_, kTooLarge);
    return std::string_view(buffer_.data(), static_cast<std::size_t>(count));
  }

 private:
  static bool leadsOut(std::string_view name) {
    const fs::path path(name);
    return name.empty() || path.is_absolute() || std::ranges::find(path, "..") != path.end();
  }

  const fs::path snapshot_;
  Reader reader_;
  std::array<char, kBlock> buffer_{};
  std::size_t entries_ = 0;
  std::uint64_t announced_ = 0;  // the sum of the sizes in the headers
  std::uint64_t bytes_ = 0;
};

// Calls `take` with every piece of the current entry until it returns an error.
template <typename Take>
Result<void> forEachPiece(Walk& walk, Take take) {
  for (;;) {
    auto piece = walk.nextPiece();
    if (!piece) return std::move(piece).error();
    const std::string_view bytes = *piece;
    if (bytes.empty()) return {};
    if (Result<void> done = take(bytes); !done) return std::move(done).error();
  }
}

// Calls `take` with every entry until it returns an error.
template <typename Take>
Result<void> forEachEntry(const fs::path& snapshot, Take take) {
  Walk walk(snapshot);
  if (Result<void> done = walk.open(); !done) return std::move(done).error();
  for (;;) {
    auto next = walk.next();
    if (!next) return std::move(next).error();
    archive_entry* const entry = *next;
    if (entry == nullptr) return {};
    if (Result<void> done = take(walk, entry); !done) return std::move(done).error();
  }
}

// Changes the working directory of the process for the lifetime of this object.
class WorkingDirectory {
 public:
  explicit WorkingDirectory(const fs::path& directory)
      : before_(::open(".", O_RDONLY | O_DIRECTORY | O_CLOEXEC)),
        error_(before_ && ::chdir(directory.c_str()) == 0 ? 0 : errno) {}
  WorkingDirectory(const WorkingDirectory&) = delete;
  WorkingDirectory& operator=(const WorkingDirectory&) = delete;
  ~WorkingDirectory() {
    if (error_ == 0) static_cast<void>(!::fchdir(before_.get()));
  }
  [[nodiscard]] int error() const { return error_; }

 private:
  const UniqueFd before_;
  const int error_;
};

// Validates all entries before anything is unpacked, so that a bad archive leaves nothing behind.
Result<void> check(const fs::path& snapshot, const fs::path& directory, ExistingFiles existing) {
  return forEachEntry(snapshot, [&](Walk&, archive_entry* entry) -> Result<void> {
    struct stat status {};
    const char* name = archive_entry_pathname(entry);
    if (existing == ExistingFiles::kRefuse && archive_entry_filetype(entry) == AE_IFREG &&
        // lstat(), because a symbolic link counts as existing even if its target is missing.
        ::lstat(name, &status) == 0) {
      return Failure<>{(directory / name).native() + ": the file already exists"};
    }
    return {};
  });
}

Result<void> unpackEntry(archive* disk, Walk& walk, archive_entry* entry,
                         const fs::path& directory) {
  const std::string name = archive_entry_pathname(entry);
  const auto diskError = [&] {
    // libarchive's text says which step failed; the system's text says why.
    const int error = archive_errno(disk);
    return Failure<>{(directory / name).native() + ": " + textOf(disk) +
                     (error > 0 ? ": " + errnoText(error) : std::string())};
  };
  if (archive_write_header(disk, entry) != ARCHIVE_OK) return diskError();
  if (archive_entry_filetype(entry) == AE_IFREG) {
    Result<void> done = forEachPiece(walk, [&](std::string_view bytes) -> Result<void> {
      if (archive_write_data(disk, bytes.data(), bytes.size()) < 0) return diskError();
      return {};
    });
    if (!done) return done;
  }
  if (archive_write_finish_entry(disk) != ARCHIVE_OK) return diskError();
  return {};
}

// Unpacks into an existing directory. The process changes to it because libarchive, as it is set up
// here, refuses absolute names.
Result<std::vector<std::string>> unpack(const fs::path& source, const fs::path& directory,
                                        ExistingFiles existing) {
  const WorkingDirectory inside(directory);
  if (inside.error() != 0) return failed(directory, errnoText(inside.error()));
  if (Result<void> done = check(source, directory, existing); !done) return std::move(done).error();
  // The names have been checked already. These options also refuse a symbolic link in the
  // directory.
  const DiskWriter disk(archive_write_disk_new());
  archive_write_disk_set_options(disk.get(), ARCHIVE_EXTRACT_SECURE_SYMLINKS |
                                                 ARCHIVE_EXTRACT_SECURE_NODOTDOT |
                                                 ARCHIVE_EXTRACT_SECURE_NOABSOLUTEPATHS);
  std::vector<std::string> names;
  Result<void> done = forEachEntry(source, [&](Walk& walk, archive_entry* entry) {
    names.emplace_back(archive_entry_pathname(entry));
    return unpackEntry(disk.get(), walk, entry, directory);
  });
  if (!done) return std::move(done).error();
  return names;
}

}  // namespace

Result<std::map<std::string, std::string>> readSnapshotFiles(
    const fs::path& snapshot, const std::vector<std::string>& names) {
  std::map<std::string, std::string> texts;
  Result<void> done = forEachEntry(snapshot, [&](Walk& walk, archive_entry* entry) -> Result<void> {
    const std::string name = archive_entry_pathname(entry);
    if (std::ranges::find(names, name) == names.end()) return {};
    std::string& text = texts[name];
    text.clear();
    return forEachPiece(walk, [&](std::string_view bytes) -> Result<void> {
      text += bytes;
      if (text.size() <= kMostBytesOfText) return {};
      return failed(snapshot, name + " in the archive is too large to be read");
    });
  });
  if (!done) return std::move(done).error();
  return texts;
}

Result<std::vector<std::string>> unpackSnapshot(const fs::path& snapshot, const fs::path& directory,
                                                ExistingFiles existing) {
  // Fails when the current working directory was deleted.
  std::error_code error;
  const fs::path source = fs::absolute(snapshot, error);
  if (error) return failed(snapshot, error.message());
  if (::access(source.c_str(), R_OK) != 0) return failed(snapshot, errnoText(errno));
  // Only this user may enter the directory, because only this user may read the snapshots.
  const bool isMade = ::mkdir(directory.c_str(), 0700) == 0;
  if (!isMade && errno != EEXIST) return failed(directory, errnoText(errno));
  auto unpacked = unpack(source, directory, existing);
  // rmdir() removes the directory only while it is empty. Unpacked files therefore stay.
  if (isMade && !unpacked) ::rmdir(directory.c_str());
  return unpacked;
}

}  // namespace halvox::tools
