#include "platform/linux/store/EraseFiles.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cmath>
#include <string_view>
#include <system_error>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/store/JsonText.h"
#include "platform/linux/store/StoreSchema.h"

namespace halvox::platform::linux_ {
namespace {

namespace fs = std::filesystem;

constexpr std::string_view kSummaryMark = "-halvox-";
constexpr std::string_view kSummaryEnd = ".json";
constexpr std::string_view kCaptureEnd = ".tar.zst";
constexpr std::size_t kLongestName = 255;
constexpr std::string_view kStampKey = "\"hvreporting_timestamp\"";
// A file is read in pieces of this size, which begin with the end of the piece before.
constexpr std::size_t kPiece = std::size_t{1} << 20U;
// Longer than an application's name in a file name, and than a key and its number.
constexpr std::size_t kOverlap = 4096;

bool hasStamp(std::string_view text, const EraseSelection& selection) {
  for (std::size_t at = 0; (at = text.find(kStampKey, at)) != std::string_view::npos;) {
    at += kStampKey.size();
    const std::size_t number = text.find_first_not_of(" :", at);
    if (number == std::string_view::npos) return false;
    double stamp = 0;
    const auto read = std::from_chars(text.data() + number, text.data() + text.size(), stamp);
    if (read.ec == std::errc() && selection.hasStamp(stamp)) return true;
  }
  return false;
}

template <typename Add>
void forEachFile(const fs::path& directory, Add add) {
  std::error_code error;
  for (fs::directory_iterator at(directory, error), end; !error && at != end; at.increment(error)) {
    std::error_code unknown;
    if (at->symlink_status(unknown).type() == fs::file_type::regular) add(at->path());
  }
}

}  // namespace

bool isSummaryOf(std::string_view fileName, std::string_view application) {
  const std::size_t mark = fileName.find(kSummaryMark);
  const std::size_t service = fileName.rfind('-');
  if (mark == std::string_view::npos || !fileName.ends_with(kSummaryEnd)) return false;
  const std::size_t begin = mark + kSummaryMark.size();
  if (service < begin) return false;
  const std::string_view name = fileName.substr(begin, service - begin);
  // A long name was cut, at most by one character more than necessary.
  constexpr std::size_t kLongestCharacter = 4;
  const bool isCut = fileName.size() + kLongestCharacter > kLongestName;
  // "_" stands for characters that a file name must not have, some of which have two bytes.
  std::size_t other = 0;
  for (const char character : name) {
    if (other == application.size()) return false;
    if (character != '_' && character != application[other]) return false;
    const bool isTwoBytes = character == '_' && application[other] == '\xC2';
    other += isTwoBytes ? 2 : 1;
  }
  return isCut || other >= application.size();
}

void EraseFiles::begin() {
  files_.clear();
  erased_ = 0;
  problem_.clear();
  forEachFile(places_.directory, [this](const fs::path& path) {
    const std::string damaged = std::string(kStoreFileName) + ".damaged-";
    if (path.filename().native().starts_with(damaged)) files_.push_back({path, Kind::kDamaged});
  });
  forEachFile(places_.directory / "snapshots", [this](const fs::path& path) {
    if (path.native().ends_with(kCaptureEnd)) files_.push_back({path, Kind::kCapture});
  });
  addSummaries();
}

void EraseFiles::addSummaries() {
  std::error_code error;
  for (fs::recursive_directory_iterator at(places_.root, error), end; !error && at != end;
       at.increment(error)) {
    const std::string name = at->path().filename().native();
    std::error_code unknown;
    if (name.find(kSummaryMark) != std::string::npos && name.ends_with(kSummaryEnd) &&
        at->symlink_status(unknown).type() == fs::file_type::regular) {
      files_.push_back({at->path(), Kind::kSummary});
    }
  }
}

bool EraseFiles::eraseNext(const EraseSelection& selection) {
  if (files_.empty()) return false;
  const File file = std::move(files_.back());
  files_.pop_back();
  if (!selects(selection, file)) return true;
  if (::unlink(file.path.c_str()) == 0) {
    ++erased_;
  } else if (errno != ENOENT) {
    problem_ = file.path.native() + ": cannot delete the file: " + errnoText(errno);
  }
  return true;
}

bool EraseFiles::selects(const EraseSelection& selection, const File& file) {
  if (file.kind == Kind::kDamaged) return true;
  const EraseRequest& request = selection.request();
  if (request.before) {
    struct stat status {};
    if (::lstat(file.path.c_str(), &status) != 0) return false;
    constexpr double kNanoseconds = 1e-9;
    return static_cast<double>(status.st_mtim.tv_sec) +
               kNanoseconds * static_cast<double>(status.st_mtim.tv_nsec) <
           *request.before;
  }
  if (file.kind == Kind::kCapture) return true;
  return (request.application &&
          isSummaryOf(file.path.filename().native(), *request.application)) ||
         selectsText(selection, file.path);
}

bool EraseFiles::selectsText(const EraseSelection& selection, const fs::path& path) {
  const UniqueFd file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW));
  std::string text;
  JsonText name;
  if (selection.request().application)
    name.append(std::string_view(*selection.request().application));
  std::string piece(kPiece, '\0');
  for (;;) {
    const ssize_t length = file ? ::read(file.get(), piece.data(), piece.size()) : -1;
    if (length < 0) {
      if (errno != ENOENT) problem_ = path.native() + ": cannot read the file: " + errnoText(errno);
      return false;
    }
    if (length == 0) return false;
    text.append(piece, 0, static_cast<std::size_t>(length));
    if (hasStamp(text, selection)) return true;
    if (name.size() > 0 && text.find(name.view()) != std::string::npos) return true;
    text.erase(0, text.size() - std::min(text.size(), kOverlap + name.size()));
  }
}

}  // namespace halvox::platform::linux_
