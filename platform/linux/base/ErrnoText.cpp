#include "platform/linux/base/ErrnoText.h"

#include <array>
#include <cerrno>
#include <cstring>

namespace halvox::platform::linux_ {

std::string errnoText(int error) {
  const int before = errno;
  // strerror() may use one buffer for all threads. This is GNU's strerror_r(), which returns the
  // text and writes into the buffer only when it has no text for the number.
  std::array<char, 64> buffer;
  std::string text = ::strerror_r(error, buffer.data(), buffer.size());
  errno = before;
  return text;
}

}  // namespace halvox::platform::linux_
