#pragma once

#include <csignal>

#include <sys/resource.h>

namespace halvox::platform::linux_ {

// While it exists, files of this process cannot grow beyond that many bytes, as on a full disk.
// Only one may exist at a time.
class FileSizeLimit {
 public:
  explicit FileSizeLimit(rlim_t bytes) : oldAction_(std::signal(SIGXFSZ, SIG_IGN)) {
    ::getrlimit(RLIMIT_FSIZE, &old_);
    const rlimit limit{bytes, old_.rlim_max};
    ::setrlimit(RLIMIT_FSIZE, &limit);
  }
  FileSizeLimit(const FileSizeLimit&) = delete;
  FileSizeLimit& operator=(const FileSizeLimit&) = delete;
  ~FileSizeLimit() {
    ::setrlimit(RLIMIT_FSIZE, &old_);
    std::signal(SIGXFSZ, oldAction_);
  }

 private:
  sighandler_t oldAction_;
  rlimit old_{};
};

}  // namespace halvox::platform::linux_
