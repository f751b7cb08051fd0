#include "platform/linux/diagnostics/BoundedFile.h"

#include <algorithm>
#include <array>
#include <cerrno>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {

Finding readBounded(const std::filesystem::path& file, std::size_t most) {
  const UniqueFd descriptor(
      ::open(file.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOFOLLOW | O_NOCTTY));
  if (!descriptor) return Finding::failed(errnoText(errno));
  struct stat status {};
  if (::fstat(descriptor.get(), &status) != 0) return Finding::failed(errnoText(errno));
  if (!S_ISREG(status.st_mode)) return Finding::failed("not a regular file");
  Finding finding;
  std::array<char, 16'384> buffer;
  for (;;) {
    // Reading one byte more than wanted shows whether the file is longer.
    const std::size_t room = std::min(buffer.size(), most + 1 - finding.bytes.size());
    const ssize_t count = ::read(descriptor.get(), buffer.data(), room);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0 && finding.bytes.empty()) return Finding::failed(errnoText(errno));
    if (count <= 0) return finding;
    finding.bytes.append(buffer.data(), static_cast<std::size_t>(count));
    if (finding.bytes.size() > most) {
      finding.bytes.resize(most);
      finding.isCut = true;
      return finding;
    }
  }
}

}  // namespace halvox::platform::linux_
