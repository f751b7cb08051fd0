#include "tools/PreferenceWriting.h"

#include <cerrno>
#include <system_error>
#include <thread>
#include <utility>

#include <fcntl.h>
#include <sys/file.h>
#include <sys/types.h>
#include <unistd.h>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/settings/LinkedFiles.h"
#include "tools/NewFile.h"

namespace halvox::tools {
namespace {

using platform::linux_::errnoText;
using platform::linux_::Failure;
using platform::linux_::linkedFiles;
using platform::linux_::PreferenceText;
using platform::linux_::readPreferenceText;
using platform::linux_::Result;
using platform::linux_::UniqueFd;

Failure<> failure(const std::filesystem::path& path, int error) {
  return {path.native() + ": " + errnoText(error)};
}

Result<void> replace(const std::filesystem::path& file, const std::string& text, mode_t mode,
                     int directory) {
  NewFile made(file);
  if (!made.write(text, mode) || !made.keepAs(file)) return failure(file, errno);
  // Without this fsync(), a crash could undo the rename.
  if (::fsync(directory) != 0) return failure(file.parent_path(), errno);
  return {};
}

// Locks the directory. Returns false when that fails or takes longer than `patience`.
bool lock(int directory, std::chrono::milliseconds patience) {
  constexpr std::chrono::milliseconds kPause{10};
  const auto end = std::chrono::steady_clock::now() + patience;
  while (::flock(directory, LOCK_EX | LOCK_NB) != 0) {
    if (errno == EINTR) continue;
    if (errno != EWOULDBLOCK || std::chrono::steady_clock::now() >= end) return false;
    // flock() has no timeout, and the system does not announce that a lock is free. Try again.
    std::this_thread::sleep_for(kPause);
  }
  return true;
}

// Returns the file that a symbolic link leads to, which need not exist. Replacing that file instead
// of the link keeps the link.
std::filesystem::path target(const std::filesystem::path& file) {
  std::error_code error;
  auto real = std::filesystem::canonical(file, error);
  if (!error) return real;
  if (error != std::errc::no_such_file_or_directory) return file;
  const auto linked = linkedFiles(std::filesystem::absolute(file, error));
  return linked.empty() ? file : linked.back();
}

}  // namespace

Result<void> changePreferenceFile(const std::filesystem::path& named, const PreferenceEdit& edit,
                                  std::chrono::milliseconds patience) {
  const std::filesystem::path file = target(named);
  const std::filesystem::path directory = file.parent_path();
  std::error_code error;
  std::filesystem::create_directories(directory, error);
  if (error) return failure(directory, error.value());
  // The directory is locked and not the file. The change replaces the file, and a lock on the old
  // one would not protect the new one.
  const UniqueFd held(::open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!held) return failure(directory, errno);
  if (!lock(held.get(), patience)) {
    if (errno != EWOULDBLOCK) return failure(directory, errno);
    return Failure<>{directory.native() +
                     ": another program has locked this directory; try again later"};
  }

  // Read under the lock, because the change must be made to the text that it will replace.
  auto content = readPreferenceText(file);
  if (!content) return std::move(content).error();
  const std::optional<PreferenceText>& old = *content;
  const std::string before = old.has_value() ? old->text : std::string();
  auto edited = edit(before, file);
  if (!edited) return std::move(edited).error();
  // A file that is replaced by itself would wake the service for nothing.
  if (*edited == before) return {};
  return replace(file, *edited, old.has_value() ? old->mode : modeOfNewFile(), held.get());
}

}  // namespace halvox::tools
