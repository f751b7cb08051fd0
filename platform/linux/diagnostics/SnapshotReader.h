#pragma once

#include <cstdint>
#include <filesystem>
#include <map>
#include <optional>
#include <string>
#include <variant>
#include <vector>

namespace halvox::platform::linux_ {

struct SnapshotReadError {
  std::string description;  // names the file and the reason
};

// The texts of some files of a snapshot, by name; those that it does not have are left out. A
// snapshot may come from anywhere: what is larger than any of ours is an error.
[[nodiscard]] std::variant<std::map<std::string, std::string>, SnapshotReadError> readSnapshotFiles(
    const std::filesystem::path& snapshot, const std::vector<std::string>& names);

enum class ExistingFiles : std::uint8_t { kRefuse, kReplace };

// Unpacks all files of a snapshot below a directory, which is made when it is missing; gives their
// names. Anything but plain files and directories, names that lead out of the directory, and links
// on the way are errors; so is, unless they may be replaced, a file that is there already. When the
// archive itself shows the error, nothing is unpacked and no directory left behind. Changes the
// process's working directory while it runs.
[[nodiscard]] std::variant<std::vector<std::string>, SnapshotReadError> extractSnapshot(
    const std::filesystem::path& snapshot, const std::filesystem::path& directory,
    ExistingFiles existing);

}  // namespace halvox::platform::linux_
