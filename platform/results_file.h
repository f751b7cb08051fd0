#pragma once

#include <cstdint>
#include <memory>
#include <string_view>

namespace halvox::platform {

// The unit of a value. The spelling of the names in this header is part of the interface.
enum class ssunit : std::uint8_t { ssunit_nanoseconds };

// A results file that is being written. The caller owns it and uses it on one thread.
class Sswriter {
 public:
  virtual ~Sswriter() = default;
};

// Writes files of measurements by name. Paths are the fixed ones of the system; the platform puts
// its storage root in front of them.
//
// Any thread may call; opening and closing wait for the disk. The composition root owns the
// service.
class ResultsFileService {
 public:
  using Writer = std::unique_ptr<Sswriter>;

  virtual ~ResultsFileService() = default;

  // Begins a file; null if it cannot be created.
  virtual Writer sswriter_open(std::string_view path, std::string_view productName,
                               std::uint32_t version, std::uint32_t flags) = 0;
  virtual void sswriter_new_value(Sswriter& writer, std::string_view name, ssunit unit,
                                  double value) = 0;
  // Finishes the file, which then appears under its name and replaces an older one. Before this
  // call the file is not visible. A writer that is destroyed without it leaves no file. Does
  // nothing if `writer` is null.
  virtual void sswriter_close(Writer writer) = 0;
};

}  // namespace halvox::platform
