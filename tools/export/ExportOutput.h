#pragma once

#include <filesystem>
#include <memory>
#include <ostream>
#include <string_view>

#include "platform/linux/base/Result.h"
#include "tools/NewFile.h"

namespace halvox::tools {

// Where an export is written to. Belongs to one thread. After a failure nothing more is written.
// The message of a failure names the output.
//
//   write() any number of times; finish()
class ExportOutput {
 public:
  ExportOutput() = default;
  ExportOutput(const ExportOutput&) = delete;
  ExportOutput& operator=(const ExportOutput&) = delete;
  virtual ~ExportOutput() = default;

  [[nodiscard]] virtual platform::linux_::Result<void> write(std::string_view bytes) = 0;
  // Returns after everything is written. Call once, after the last write().
  [[nodiscard]] virtual platform::linux_::Result<void> finish() = 0;
};

// Writes to a stream, which must outlive the output: the standard output.
[[nodiscard]] std::unique_ptr<ExportOutput> makeStreamOutput(std::ostream& stream);

// Writes to a file. A new file gets its name in finish(); if that is never called, nothing is left.
// What is not a regular file, such as a pipe or /dev/stdout, is written to directly.
[[nodiscard]] std::unique_ptr<ExportOutput> makeFileOutput(const std::filesystem::path& file,
                                                           NewFile::Existing existing);

}  // namespace halvox::tools
