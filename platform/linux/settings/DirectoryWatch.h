#pragma once

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <map>
#include <set>
#include <string>
#include <string_view>
#include <system_error>
#include <vector>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {

// Watches the files in some directories with inotify. A directory need not exist. The watch then
// waits until it appears. Uses no timer, so that an idle service causes no wake-ups.
//
//   made --arm()--> armed --(a directory appeared, disappeared or was moved; events were lost)-->
//   must be armed again --arm()--> armed
//
// Belongs to one thread and one owner. If a directory cannot be watched, arm() returns the error
// and still watches the other directories.
class DirectoryWatch {
 public:
  // Whether the file exists after the change.
  enum class Change : unsigned char { kFileChanged, kFileGone };
  // `directory` is an index into the list that arm() was given; `file` is the name in it.
  using OnChange = std::function<void(std::size_t directory, std::string_view file, Change change)>;
  enum class State : unsigned char { kArmed, kMustBeArmedAgain };

  // Starts to watch these directories (absolute paths) instead of the previous ones. Changes
  // between the last read() and this call are lost. Compare the files afterwards. Returns the first
  // error for a directory that exists but cannot be watched.
  [[nodiscard]] std::error_code arm(std::vector<std::filesystem::path> directories);
  // Returns true when the directory existed at the last arm().
  [[nodiscard]] bool isThere(std::size_t directory) const { return isThere_[directory]; }
  [[nodiscard]] const std::filesystem::path& path(std::size_t directory) const {
    return directories_[directory];
  }
  // Readable (poll) when read() has something to do; -1 before the first arm(). Owned by this
  // object, and replaced by arm().
  [[nodiscard]] int descriptor() const { return inotify_.get(); }
  // Calls `onChange` on this thread for each file that was written, touched, created, moved or
  // deleted since the last call. Does not wait.
  [[nodiscard]] State read(const OnChange& onChange);

 private:
  struct Watch {
    std::vector<std::size_t> directories;        // indices of this directory in the list
    std::set<std::string, std::less<>> awaited;  // missing names on the way to a directory
  };

  [[nodiscard]] std::error_code watchWay(std::size_t directory);
  [[nodiscard]] std::error_code add(const std::filesystem::path& path, std::uint32_t events,
                                    Watch*& watch);

  std::vector<std::filesystem::path> directories_;
  UniqueFd inotify_;
  std::map<int, Watch> watches_;
  std::vector<bool> isThere_;  // by directory
};

}  // namespace halvox::platform::linux_
