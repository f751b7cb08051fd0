#include "platform/linux/diagnostics/BoundedFile.h"

#include <utility>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/base/WholeFile.h"

namespace halvox::platform::linux_ {

Finding readBounded(const std::filesystem::path& file, std::size_t most) {
  // Links are refused, because a capture runs with the rights of the service and a link in a
  // directory that others write could lead anywhere.
  FileContent content = readWholeFile({.path = file.c_str(),
                                       .most = most,
                                       .links = FileToRead::Links::kRefused,
                                       .excess = FileToRead::Excess::kCut});
  switch (content.outcome) {
    case FileContent::Outcome::kNotRegular:
      return Finding::failed("not a regular file");
    case FileContent::Outcome::kMissing:
    case FileContent::Outcome::kFailed:
      // A capture keeps what could be read before an error.
      if (content.bytes.empty()) return Finding::failed(errnoText(content.error));
      break;
    case FileContent::Outcome::kRead:
    case FileContent::Outcome::kTooLarge:
      break;
  }
  const bool isCut = content.outcome == FileContent::Outcome::kTooLarge;
  return {.bytes = std::move(content.bytes), .isCut = isCut};
}

}  // namespace halvox::platform::linux_
