#include "platform/linux/files/RootedDirectory.h"

#include <cerrno>
#include <utility>
#include <vector>

#include <fcntl.h>
#include <sys/stat.h>

#include "platform/linux/files/FileError.h"

namespace halvox::platform::linux_ {
namespace {

constexpr mode_t kParentPermissions = 0755;
constexpr int kOpenFlags = O_RDONLY | O_DIRECTORY | O_CLOEXEC;

RootedDirectory failed(std::string_view what, const std::string& path, int systemError) {
  return {{}, fileError(what, path, systemError)};
}

// Splits a path into the names below the root. Returns std::nullopt for a path with ".." or NUL.
std::optional<std::vector<std::string>> namesOf(std::string_view path) {
  std::vector<std::string> names;
  if (path.find('\0') != std::string_view::npos) return std::nullopt;
  for (const std::filesystem::path& part : std::filesystem::path(path).relative_path()) {
    if (part == "..") return std::nullopt;
    if (!part.empty() && part != ".") names.push_back(part.string());
  }
  return names;
}

// Returns ELOOP if `name` is a symbolic link. With O_NOFOLLOW and O_DIRECTORY the system's error
// for a link is "not a directory", which does not help to find the cause.
int reasonAt(const UniqueFd& parent, const std::string& name, int systemError) {
  struct stat status {};
  const bool isLink = ::fstatat(parent.get(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 &&
                      S_ISLNK(status.st_mode);
  return isLink ? ELOOP : systemError;
}

enum class Missing : std::uint8_t { kIsAnError, kIsMade };

// Opens `name` in `parent`. Sets `made` if the directory was created.
RootedDirectory step(const UniqueFd& parent, const std::string& name, const std::string& path,
                     Missing missing, bool& made) {
  made = false;
  if (missing == Missing::kIsMade) {
    made = ::mkdirat(parent.get(), name.c_str(), kParentPermissions) == 0;
    if (!made && errno != EEXIST) return failed("create directory", path, errno);
  }
  // Open one name at a time, because O_NOFOLLOW checks only the last name of a path.
  UniqueFd directory(::openat(parent.get(), name.c_str(), kOpenFlags | O_NOFOLLOW));
  if (!directory) return failed("open directory", path, reasonAt(parent, name, errno));
  return {std::move(directory), std::nullopt};
}

RootedDirectory walk(const RootedDirectory::Place& place, Missing missing,
                     std::optional<std::uint32_t> permissions) {
  const auto names = namesOf(place.path);
  if (!names.has_value()) return failed("use directory", place.text(), EINVAL);
  std::string path = place.root.string();
  RootedDirectory at{UniqueFd(::open(path.c_str(), kOpenFlags)), std::nullopt};
  if (!at.descriptor) return failed("open directory", path, errno);
  bool made = false;
  for (const std::string& name : *names) {
    path += '/' + name;
    at = step(at.descriptor, name, path, missing, made);
    if (at.error.has_value()) return at;
  }
  // Set the permissions with fchmod(), because mkdirat() applies the umask.
  if (made && permissions.has_value() && ::fchmod(at.descriptor.get(), *permissions) != 0) {
    return failed("set the permissions of directory", path, errno);
  }
  return at;
}

}  // namespace

std::string RootedDirectory::Place::text() const {
  return (root / std::filesystem::path(path).relative_path()).string();
}

RootedDirectory RootedDirectory::open(const Place& place) {
  return walk(place, Missing::kIsAnError, std::nullopt);
}

RootedDirectory RootedDirectory::make(const Place& place, std::uint32_t permissions) {
  std::error_code error;
  std::filesystem::create_directories(place.root, error);
  if (error) return failed("create directory", place.root.string(), error.value());
  return walk(place, Missing::kIsMade, permissions);
}

}  // namespace halvox::platform::linux_
