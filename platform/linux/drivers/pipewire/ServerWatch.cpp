#include "platform/linux/drivers/pipewire/ServerWatch.h"

#include <array>
#include <climits>
#include <cstddef>
#include <filesystem>
#include <utility>

#include <sys/inotify.h>

#include "platform/linux/drivers/pipewire/ServerSocket.h"

namespace halvox::platform::linux_ {
ServerWatch::ServerWatch(pw_loop* loop, std::function<void()> onAppeared)
    : loop_(loop), onAppeared_(std::move(onAppeared)) {
  for (const std::filesystem::path& path : serverSocketPaths()) {
    name_ = path.filename();
    directories_.push_back(path.parent_path());
  }
}

void ServerWatch::begin() {
  if (source_ != nullptr) return;
  inotify_.reset(::inotify_init1(IN_NONBLOCK | IN_CLOEXEC));
  if (inotify_ && watchDirectories()) {
    source_ =
        pw_loop_add_io(loop_, inotify_.get(), SPA_IO_IN, false, &ServerWatch::onReadable, this);
  }
  if (source_ == nullptr) inotify_.reset();
}

void ServerWatch::end() {
  if (source_ != nullptr) pw_loop_destroy_source(loop_, std::exchange(source_, nullptr));
  inotify_.reset();
}

bool ServerWatch::watchDirectories() const {
  bool isAny = false;
  for (const std::string& directory : directories_) {
    if (::inotify_add_watch(inotify_.get(), directory.c_str(),
                            IN_CREATE | IN_MOVED_TO | IN_ONLYDIR) >= 0) {
      isAny = true;
    }
  }
  return isAny;
}

ServerWatch::News ServerWatch::takeNews() const {
  News news;
  alignas(inotify_event) std::array<std::byte, sizeof(inotify_event) + NAME_MAX + 1> buffer;
  for (;;) {
    const ssize_t size = ::read(inotify_.get(), buffer.data(), buffer.size());
    if (size <= 0) return news;
    for (std::size_t at = 0; at < static_cast<std::size_t>(size);) {
      const auto* event = reinterpret_cast<const inotify_event*>(&buffer[at]);
      // Events were lost; one of them may have been about the name.
      if ((event->mask & IN_Q_OVERFLOW) != 0) news.hasAppeared = true;
      if ((event->mask & IN_IGNORED) != 0) news.isDirectoryGone = true;
      if (event->len > 0 && name_ == event->name) news.hasAppeared = true;
      at += sizeof(inotify_event) + event->len;
    }
  }
}

void ServerWatch::onReadable(void* data, int /*descriptor*/, std::uint32_t /*mask*/) {
  auto* self = static_cast<ServerWatch*>(data);
  const News news = self->takeNews();
  // Continue with the directories that still exist.
  if (news.isDirectoryGone) {
    self->end();
    self->begin();
  }
  if (news.hasAppeared) self->onAppeared_();
}

}  // namespace halvox::platform::linux_
