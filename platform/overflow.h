#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>

#include "platform/connection.h"

namespace halvox::platform {

// Where an OverflowService keeps some bytes.
struct OverflowPlace {
  std::uint64_t offset = 0;
  std::size_t length = 0;  // in bytes
};

// Keeps bytes outside memory for the life of the process. It is meant for bytes that clients make
// the service keep and that are read late or never. When the process ends, in whatever way, nothing
// remains.
//
// Any thread may call. Writing and reading may wait for the disk, usually for less time than the
// bytes take to copy, because they go through the page cache. The composition root owns the
// service.
class OverflowService {
 public:
  virtual ~OverflowService() = default;

  // How many bytes of memory one client may take before its histories overflow.
  [[nodiscard]] virtual std::size_t memoryPerClient() const = 0;

  // Keeps a copy of the bytes and sets `place`. On an error nothing is kept, and `place` is
  // unchanged.
  [[nodiscard]] virtual std::optional<Error> write(std::span<const std::byte> bytes,
                                                   OverflowPlace& place) = 0;
  // Reads the bytes at a place that write() returned. `bytes` must have the length of the place.
  [[nodiscard]] virtual std::optional<Error> read(OverflowPlace place,
                                                  std::span<std::byte> bytes) = 0;
  // Frees a place, which must not be used again.
  virtual void release(OverflowPlace place) = 0;
};

}  // namespace halvox::platform
