#include "platform/linux/settings/DirectoryWatch.h"

#include <cerrno>
#include <utility>

#include <sys/inotify.h>
#include <unistd.h>

namespace halvox::platform::linux_ {
namespace {

// The watched directory itself was moved or deleted.
constexpr std::uint32_t kLeaving = IN_MOVE_SELF | IN_DELETE_SELF;
constexpr std::uint32_t kAppearing = IN_CREATE | IN_MOVED_TO;
constexpr std::uint32_t kVanishing = IN_MOVED_FROM | IN_DELETE;
// IN_CLOSE_WRITE and not IN_MODIFY, because a save is one change, however many writes it makes.
// IN_ATTRIB notices `touch`.
constexpr std::uint32_t kChanging = IN_CLOSE_WRITE | IN_ATTRIB | kAppearing | kVanishing;
// After one of these events, some watches may be missing. All of them are then made again.
constexpr std::uint32_t kGone = kLeaving | IN_IGNORED | IN_UNMOUNT | IN_Q_OVERFLOW;

bool isMissing(std::error_code error) {
  return error == std::errc::no_such_file_or_directory || error == std::errc::not_a_directory;
}

std::error_code lastError() { return {errno, std::generic_category()}; }

// Returns the paths in one form: "/a//b/" becomes "/a/b".
std::vector<std::filesystem::path> normal(std::vector<std::filesystem::path> paths) {
  for (auto& path : paths) {
    path = path.lexically_normal();
    if (!path.has_filename() && path.has_relative_path()) path = path.parent_path();
  }
  return paths;
}

}  // namespace

std::error_code DirectoryWatch::arm(std::vector<std::filesystem::path> directories) {
  directories_ = normal(std::move(directories));
  // The descriptors of the old instance are not valid for the new one.
  watches_.clear();
  isThere_.assign(directories_.size(), false);
  // A new instance, instead of removing watches one by one, because the events of the old watches
  // disappear with the old instance.
  inotify_.reset(::inotify_init1(IN_NONBLOCK | IN_CLOEXEC));
  if (!inotify_) return lastError();
  std::error_code first;
  for (std::size_t place = 0; place < directories_.size(); ++place) {
    const std::error_code error = watchWay(place);
    if (!first) first = error;
  }
  return first;
}

// The kernel has one watch for each directory and returns its descriptor again for a second call.
// With IN_MASK_ADD, the call adds events to those of an earlier call. Without it, the call would
// replace them.
std::error_code DirectoryWatch::add(const std::filesystem::path& path, std::uint32_t events,
                                    Watch*& watch) {
  const int descriptor =
      ::inotify_add_watch(inotify_.get(), path.c_str(), events | IN_ONLYDIR | IN_MASK_ADD);
  if (descriptor < 0) return lastError();
  watch = &watches_[descriptor];
  return {};
}

// Watches every directory from the root to the wanted one: the last one for changes of its files,
// the others only for being moved or deleted. If a directory is missing, watches its parent until
// it appears.
std::error_code DirectoryWatch::watchWay(std::size_t directory) {
  const std::filesystem::path& target = directories_[directory];
  std::filesystem::path path;
  std::filesystem::path parent;
  for (const auto& part : target) {
    path /= part;
    const bool isTarget = path == target;
    Watch* watch = nullptr;
    std::error_code error = add(path, isTarget ? kChanging | kLeaving : kLeaving, watch);
    // If a directory is missing, watch its parent, so that its appearance is noticed.
    if (isMissing(error) && !parent.empty()) {
      Watch* last = nullptr;
      if (const auto refused = add(parent, kAppearing, last)) return refused;
      last->awaited.insert(part.native());
      // Try again, because the directory may have appeared before the parent was watched.
      error = add(path, isTarget ? kChanging | kLeaving : kLeaving, watch);
      if (isMissing(error)) return {};
    }
    // A directory that may be searched but not read cannot be watched. If it is only a parent of
    // the target, assume that it is never moved or deleted.
    if (error == std::errc::permission_denied && !isTarget) error.clear();
    if (error) return error;
    if (isTarget) {
      watch->directories.push_back(directory);
      isThere_[directory] = true;
    }
    parent = path;
  }
  return {};
}

DirectoryWatch::State DirectoryWatch::read(const OnChange& onChange) {
  State state = State::kArmed;
  alignas(inotify_event) char buffer[16'384];
  for (;;) {
    const ssize_t size = ::read(inotify_.get(), buffer, sizeof buffer);
    if (size < 0 && errno == EINTR) continue;
    if (size <= 0) return state;
    for (const char* next = buffer; next < buffer + size;) {
      const auto* event = reinterpret_cast<const inotify_event*>(next);
      next += sizeof(inotify_event) + event->len;
      if ((event->mask & kGone) != 0) state = State::kMustBeArmedAgain;
      const auto watch = watches_.find(event->wd);
      // Ignore events of a watch that was removed, and events about the directory itself, which
      // kGone covers.
      if (watch == watches_.end() || event->len == 0) continue;
      const std::string_view file(event->name);
      if (watch->second.awaited.contains(file)) state = State::kMustBeArmedAgain;
      const Change change =
          (event->mask & kVanishing) != 0 ? Change::kFileGone : Change::kFileChanged;
      for (const std::size_t directory : watch->second.directories) {
        onChange(directory, file, change);
      }
    }
  }
}

}  // namespace halvox::platform::linux_
