#include "platform/linux/files/UnnamedFile.h"

#include <cerrno>
#include <string>

#include <fcntl.h>
#include <sys/stat.h>

namespace halvox::platform::linux_ {
namespace {

constexpr const char* kName = ".halvox-overflow";
constexpr mode_t kPermissions = 0600;  // what clients reported

}  // namespace

int createUnnamedFile(const std::filesystem::path& directory, UniqueFd& file,
                      int (*removeName)(const char*)) {
  const std::string name = (directory / kName).string();
  // Another process may have created a file of this name a moment ago, or may have died before it
  // removed the name. Remove the name, because processes need only the descriptor.
  const auto remove = [&] { return removeName(name.c_str()) == 0 || errno == ENOENT ? 0 : errno; };
  if (const int error = remove()) return error;
  file.reset(::open(name.c_str(), O_CREAT | O_EXCL | O_RDWR | O_CLOEXEC, kPermissions));
  if (!file) return errno;
  const int error = remove();
  // The file may keep its name. Close it, because nothing may be written into a file that others
  // can find.
  if (error != 0) file.reset();
  return error;
}

}  // namespace halvox::platform::linux_
