#include "platform/linux/files/UnnamedFile.h"

#include <cerrno>
#include <random>
#include <string>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace halvox::platform::linux_ {
namespace {

constexpr const char* kName = ".halvox-overflow";
constexpr mode_t kPermissions = 0600;  // what clients reported
// Between the removal of the name and the creation of the file, another process may create its own
// file. It removes the name at once.
constexpr int kMostAttempts = 16;

// True if the name can never be ours.
bool isOfAnother(const std::string& name) {
  struct stat status {};
  if (::lstat(name.c_str(), &status) != 0) return false;
  return S_ISDIR(status.st_mode) || status.st_uid != ::geteuid();
}

std::string randomName() {
  std::random_device device;
  return std::string(kName) + "-" + std::to_string(device()) + "-" + std::to_string(device());
}

}  // namespace

int createUnnamedFile(const std::filesystem::path& directory, UniqueFd& file,
                      int (*removeName)(const char*)) {
  std::string name = (directory / kName).string();
  const auto remove = [&] { return removeName(name.c_str()) == 0 || errno == ENOENT ? 0 : errno; };
  int error = EEXIST;
  for (int attempt = 0; attempt < kMostAttempts && error == EEXIST; ++attempt) {
    // Another process may have created a file of this name a moment ago, or may have died before it
    // removed the name. Remove the name, because processes need only the descriptor.
    if ((error = remove()) != 0) {
      if ((error != EISDIR && error != EPERM) || !isOfAnother(name)) return error;
      name = (directory / randomName()).string();
    }
    file.reset(::open(name.c_str(), O_CREAT | O_EXCL | O_RDWR | O_CLOEXEC, kPermissions));
    error = file ? 0 : errno;
  }
  if (error != 0) return error;
  error = remove();
  // The file may keep its name. Close it, because nothing may be written into a file that others
  // can find.
  if (error != 0) file.reset();
  return error;
}

}  // namespace halvox::platform::linux_
