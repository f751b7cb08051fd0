#include "platform/linux/drivers/textfile/RemovedFiles.h"

#include <array>
#include <cerrno>
#include <climits>
#include <cstddef>
#include <utility>

#include <sys/inotify.h>
#include <unistd.h>

#include "platform/linux/base/ErrnoText.h"

namespace halvox::platform::linux_ {
namespace {

// IN_MOVED_FROM is not included. Each update by renaming causes such an event for the temporary
// name. Between two sessions, these events would fill the kernel's queue.
constexpr std::uint32_t kEvents = IN_DELETE | IN_MOVE_SELF | IN_ONLYDIR;

}  // namespace

RemovedFiles::Removed RemovedFiles::take() {
  Removed removed;
  alignas(inotify_event) std::array<std::byte, 16 * (sizeof(inotify_event) + NAME_MAX + 1)> buffer;
  while (inotify_) {
    const ssize_t size = ::read(inotify_.get(), buffer.data(), buffer.size());
    if (size <= 0) break;
    for (std::size_t offset = 0; offset < static_cast<std::size_t>(size);) {
      const auto* event = reinterpret_cast<const inotify_event*>(buffer.data() + offset);
      offset += sizeof(inotify_event) + event->len;
      if ((event->mask & IN_Q_OVERFLOW) != 0) {
        removed.areAll = true;
      } else if (event->wd != watched_) {
        continue;  // from a directory that is not watched any more
      } else if ((event->mask & IN_DELETE) != 0) {
        removed.names.emplace_back(event->name);
      } else {
        // The directory was deleted or moved away.
        removed.areAll = true;
        if ((event->mask & IN_MOVE_SELF) != 0) ::inotify_rm_watch(inotify_.get(), watched_);
        watched_ = -1;
      }
    }
  }
  watch();
  return removed;
}

void RemovedFiles::watch() {
  if (watched_ != -1) return;
  if (!inotify_) inotify_.reset(::inotify_init1(IN_NONBLOCK | IN_CLOEXEC));
  if (inotify_) watched_ = ::inotify_add_watch(inotify_.get(), directory_.c_str(), kEvents);
  if (watched_ != -1) return;
  // Do not log this, because the source finds no files anyway in a directory that cannot be opened.
  const bool isNoDirectory = errno == ENOENT || errno == ENOTDIR || errno == EACCES;
  if (isNoDirectory || std::exchange(isFailureLogged_, true)) return;
  log_.error("cannot watch the directory ", directory_.string(),
             " for deleted files: ", errnoText(errno),
             "; a file that is deleted and written again counts as the same file");
}

}  // namespace halvox::platform::linux_
