#include "platform/linux/diagnostics/SnapshotReader.h"

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

#include "platform/linux/UniqueHandle.h"
#include "platform/linux/diagnostics/BoundedFile.h"

namespace halvox::platform::linux_ {
namespace {

namespace fs = std::filesystem;

using Reader = UniqueHandle<archive*, archive_read_free>;
using DiskWriter = UniqueHandle<archive*, archive_write_free>;
using Failure = std::optional<SnapshotReadError>;

constexpr std::size_t kBlock = 64U << 10U;
// More than any of ours has.
constexpr std::uint64_t kMostBytes = 256U << 20U;
constexpr std::size_t kMostEntries = 10'000;
constexpr std::size_t kMostBytesOfText = 16U << 20U;
// What the library says instead of an error of the system when a file has another format.
constexpr int kUnknownFormat = EILSEQ;

SnapshotReadError failed(const fs::path& snapshot, const std::string& why) {
  return {snapshot.native() + ": " + why};
}

std::string textOf(archive* handle) {
  const char* text = archive_error_string(handle);
  return text == nullptr ? "it cannot be read" : text;
}

// One way through all entries of an archive.
class Walk {
 public:
  explicit Walk(const fs::path& snapshot) : snapshot_(snapshot), reader_(archive_read_new()) {}

  [[nodiscard]] Failure open() {
    // A pipe could keep us waiting for ever, and to the library no name is the standard input.
    struct stat status {};
    if (::stat(snapshot_.c_str(), &status) != 0) return failed(snapshot_, errorText(errno));
    if (!S_ISREG(status.st_mode)) {
      return failed(snapshot_, S_ISDIR(status.st_mode) ? errorText(EISDIR) : "it is no file");
    }
    archive_read_support_format_tar(reader_.get());
    archive_read_support_filter_zstd(reader_.get());
    if (archive_read_open_filename(reader_.get(), snapshot_.c_str(), kBlock) == ARCHIVE_OK) {
      return std::nullopt;
    }
    const int error = archive_errno(reader_.get());
    if (error == kUnknownFormat) return failed(snapshot_, "it is no snapshot");
    return failed(snapshot_, error > 0 ? errorText(error) : textOf(reader_.get()));
  }

  // The next entry, or null at the end; an error when there is no reading on.
  [[nodiscard]] std::variant<archive_entry*, SnapshotReadError> next() {
    archive_entry* entry = nullptr;
    const int result = archive_read_next_header(reader_.get(), &entry);
    if (result == ARCHIVE_EOF) return nullptr;
    if (result != ARCHIVE_OK) return failed(snapshot_, textOf(reader_.get()));
    if (++entries_ > kMostEntries) return failed(snapshot_, "it has too many files");
    // What is passed over is unpacked too, so the sizes count before anything is.
    announced_ += std::min(static_cast<std::uint64_t>(archive_entry_size(entry)), kMostBytes + 1);
    if (announced_ > kMostBytes) return failed(snapshot_, "it is too large when unpacked");
    const char* name = archive_entry_pathname(entry);
    const auto type = archive_entry_filetype(entry);
    if (name == nullptr || archive_entry_hardlink(entry) != nullptr ||
        (type != AE_IFREG && type != AE_IFDIR) || leadsOut(name)) {
      return failed(snapshot_, "it is no snapshot: it has something else than plain files in it");
    }
    return entry;
  }

  // The next piece of the current entry; empty at its end.
  [[nodiscard]] std::variant<std::string_view, SnapshotReadError> nextPiece() {
    const la_ssize_t count = archive_read_data(reader_.get(), buffer_.data(), buffer_.size());
    if (count < 0) return failed(snapshot_, textOf(reader_.get()));
    bytes_ += static_cast<std::uint64_t>(count);
    if (bytes_ > kMostBytes) return failed(snapshot_, "it is too large when unpacked");
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
  std::uint64_t announced_ = 0;  // by the headers
  std::uint64_t bytes_ = 0;
};

// Gives every piece of the current entry to `take`, which returns an error or none.
template <typename Take>
Failure forEachPiece(Walk& walk, Take take) {
  for (;;) {
    auto piece = walk.nextPiece();
    if (auto* error = std::get_if<SnapshotReadError>(&piece)) return std::move(*error);
    const auto bytes = std::get<std::string_view>(piece);
    if (bytes.empty()) return std::nullopt;
    if (Failure failure = take(bytes)) return failure;
  }
}

// Gives every entry to `take`, which returns an error or none.
template <typename Take>
Failure forEachEntry(const fs::path& snapshot, Take take) {
  Walk walk(snapshot);
  if (Failure failure = walk.open()) return failure;
  for (;;) {
    auto next = walk.next();
    if (auto* error = std::get_if<SnapshotReadError>(&next)) return std::move(*error);
    archive_entry* const entry = std::get<archive_entry*>(next);
    if (entry == nullptr) return std::nullopt;
    if (Failure failure = take(walk, entry)) return failure;
  }
}

// The process is in that directory as long as this lives.
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

// Looks at all entries, so that an archive with a bad one leaves nothing behind.
Failure check(const fs::path& snapshot, const fs::path& directory, ExistingFiles existing) {
  return forEachEntry(snapshot, [&](Walk&, archive_entry* entry) -> Failure {
    struct stat status {};
    const char* name = archive_entry_pathname(entry);
    if (existing == ExistingFiles::kRefuse && archive_entry_filetype(entry) == AE_IFREG &&
        ::lstat(name, &status) == 0) {
      return SnapshotReadError{(directory / name).native() + ": it is there already"};
    }
    return std::nullopt;
  });
}

Failure unpackEntry(archive* disk, Walk& walk, archive_entry* entry, const fs::path& directory) {
  const std::string name = archive_entry_pathname(entry);
  const auto diskError = [&] {
    // The library's text says what failed, and this why.
    const int error = archive_errno(disk);
    return SnapshotReadError{(directory / name).native() + ": " + textOf(disk) +
                             (error > 0 ? ": " + errorText(error) : std::string())};
  };
  if (archive_write_header(disk, entry) != ARCHIVE_OK) return diskError();
  if (archive_entry_filetype(entry) == AE_IFREG) {
    Failure failure = forEachPiece(walk, [&](std::string_view bytes) -> Failure {
      if (archive_write_data(disk, bytes.data(), bytes.size()) < 0) return diskError();
      return std::nullopt;
    });
    if (failure) return failure;
  }
  if (archive_write_finish_entry(disk) != ARCHIVE_OK) return diskError();
  return std::nullopt;
}

// Into a directory that is there.
std::variant<std::vector<std::string>, SnapshotReadError> unpack(const fs::path& source,
                                                                 const fs::path& directory,
                                                                 ExistingFiles existing) {
  const WorkingDirectory inside(directory);
  if (inside.error() != 0) return failed(directory, errorText(inside.error()));
  if (Failure failure = check(source, directory, existing)) return std::move(*failure);
  const DiskWriter disk(archive_write_disk_new());
  archive_write_disk_set_options(disk.get(), ARCHIVE_EXTRACT_SECURE_SYMLINKS |
                                                 ARCHIVE_EXTRACT_SECURE_NODOTDOT |
                                                 ARCHIVE_EXTRACT_SECURE_NOABSOLUTEPATHS);
  std::vector<std::string> names;
  Failure failure = forEachEntry(source, [&](Walk& walk, archive_entry* entry) {
    names.emplace_back(archive_entry_pathname(entry));
    return unpackEntry(disk.get(), walk, entry, directory);
  });
  if (failure) return std::move(*failure);
  return names;
}

}  // namespace

std::variant<std::map<std::string, std::string>, SnapshotReadError> readSnapshotFiles(
    const fs::path& snapshot, const std::vector<std::string>& names) {
  std::map<std::string, std::string> texts;
  Failure failure = forEachEntry(snapshot, [&](Walk& walk, archive_entry* entry) -> Failure {
    const std::string name = archive_entry_pathname(entry);
    if (std::ranges::find(names, name) == names.end()) return std::nullopt;
    std::string& text = texts[name];
    text.clear();
    return forEachPiece(walk, [&](std::string_view bytes) -> Failure {
      text += bytes;
      if (text.size() <= kMostBytesOfText) return std::nullopt;
      return failed(snapshot, name + " in it is too large");
    });
  });
  if (failure) return std::move(*failure);
  return texts;
}

std::variant<std::vector<std::string>, SnapshotReadError> extractSnapshot(const fs::path& snapshot,
                                                                          const fs::path& directory,
                                                                          ExistingFiles existing) {
  // The working directory may be gone.
  std::error_code error;
  const fs::path source = fs::absolute(snapshot, error);
  if (error) return failed(snapshot, error.message());
  if (::access(source.c_str(), R_OK) != 0) return failed(snapshot, errorText(errno));
  const bool isMade = ::mkdir(directory.c_str(), 0700) == 0;
  if (!isMade && errno != EEXIST) return failed(directory, errorText(errno));
  auto unpacked = unpack(source, directory, existing);
  // Only an empty one goes.
  if (isMade && unpacked.index() != 0) ::rmdir(directory.c_str());
  return unpacked;
}

}  // namespace halvox::platform::linux_
