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

#include "platform/linux/UniqueHandle.h"

namespace halvox::platform::linux_ {

// Hears of what happens to the files of some directories, which need not exist: then it waits for
// them to appear. Costs nothing while nothing happens.
//
//   made --arm()--> armed --(a directory appeared, vanished or was moved; events were lost)-->
//   arm()
//
// Belongs to one thread.
class DirectoryWatch {
 public:
  // What a change left behind: a file that is there, or none.
  enum class Change : unsigned char { kFileChanged, kFileGone };
  // The place of the directory among those that are watched, and the name of the file in it.
  using OnChange = std::function<void(std::size_t directory, std::string_view file, Change change)>;
  enum class State : unsigned char { kArmed, kMustBeArmedAgain };

  // Begins anew, with these directories, which are absolute paths. What happened before, also
  // unnoticed, is for the caller to find out afterwards. Gives the reason when a directory cannot
  // be watched though it is there.
  [[nodiscard]] std::error_code arm(std::vector<std::filesystem::path> directories);
  // Whether that directory was there at the last arm().
  [[nodiscard]] bool isThere(std::size_t directory) const { return isThere_[directory]; }
  [[nodiscard]] const std::filesystem::path& path(std::size_t directory) const {
    return directories_[directory];
  }
  // Readable when something has happened; -1 before the first arm().
  [[nodiscard]] int descriptor() const { return inotify_.get(); }
  // Tells of each file that was written, touched, created, moved or deleted since the last call.
  [[nodiscard]] State read(const OnChange& onChange);

 private:
  struct Watch {
    std::vector<std::size_t> directories;        // those that this one is
    std::set<std::string, std::less<>> awaited;  // names that are missing on the way to one
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
