#pragma once

#include <cstdint>
#include <cstdlib>
#include <span>
#include <string>

#include <sys/mman.h>
#include <unistd.h>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::fuzzing {

// Aborts, so that the fuzzer keeps the input.
inline void require(bool condition) {
  if (!condition) std::abort();
}

// A file in memory with the bytes of a run, for readers that open a path. One thread uses it.
class InputFile {
 public:
  explicit InputFile(std::span<const std::uint8_t> bytes) : fd_(::memfd_create("input", 0)) {
    require(fd_.get() >= 0);
    while (!bytes.empty()) {
      const ssize_t written = ::write(fd_.get(), bytes.data(), bytes.size());
      require(written > 0);
      bytes = bytes.subspan(static_cast<std::size_t>(written));
    }
  }

  // Valid as long as this object exists.
  [[nodiscard]] std::string path() const { return "/proc/self/fd/" + std::to_string(fd_.get()); }

 private:
  platform::linux_::UniqueFd fd_;
};

}  // namespace halvox::fuzzing
