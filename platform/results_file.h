#pragma once

#include <cstdint>
#include <memory>
#include <string_view>

namespace halvox::platform {

enum class ssunit : std::uint8_t { ssunit_nanoseconds };

// A results file that is being written. Belongs to one thread.
class Sswriter {
 public:
  virtual ~Sswriter() = default;
};

// Writes files of measurements by name. Paths are the system's fixed ones; the platform puts its
// storage root before them. Any thread may call; waits for the disk.
class ResultsFileService {
 public:
  using Writer = std::unique_ptr<Sswriter>;

  virtual ~ResultsFileService() = default;

  // Null when the file cannot be made.
  virtual Writer sswriter_open(std::string_view path, std::string_view productName,
                               std::uint32_t version, std::uint32_t flags) = 0;
  virtual void sswriter_new_value(Sswriter& writer, std::string_view name, ssunit unit,
                                  double value) = 0;
  // Finishes the file, which then has its name, in the place of one that had it, and lets go of the
  // writer. Until then nobody sees it; a writer that is destroyed instead leaves nothing. No
  // writer: nothing happens.
  virtual void sswriter_close(Writer writer) = 0;
};

}  // namespace halvox::platform
