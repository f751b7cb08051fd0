#include "tools/export/ExportProgress.h"

#include "tools/TimeText.h"

namespace halvox::tools {
namespace {

constexpr std::chrono::milliseconds kBetweenTwo{200};
// To the beginning of the line, and clear it.
constexpr const char* kClearLine = "\r\x1b[K";

}  // namespace

void ExportProgress::show(double time) {
  const auto now = std::chrono::steady_clock::now();
  if (isVisible_ && now - last_ < kBetweenTwo) return;
  last_ = now;
  isVisible_ = true;
  out_ << kClearLine << records_ << " records read, until " << localTime(time) << std::flush;
}

void ExportProgress::clear() {
  if (isVisible_) out_ << kClearLine << std::flush;
  isVisible_ = false;
}

}  // namespace halvox::tools
