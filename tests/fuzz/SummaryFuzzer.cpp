// Reads arbitrary bytes as a session's summary, as the name of one, and as the application that a
// summary file is named after.

#include <cstdint>
#include <span>
#include <string>
#include <string_view>

#include "platform/linux/base/Utf8.h"
#include "session/SummaryFileName.h"
#include "tests/fuzz/InputFile.h"
#include "tools/SummaryReader.h"

namespace {

using namespace halvox;
using fuzzing::require;

void checkName(std::string_view text) {
  static_cast<void>(tools::parseSummaryName(text));
  const platform::LocalTime time{.year = 2023,
                                 .month = 11,
                                 .day = 14,
                                 .hour = 22,
                                 .minute = 13,
                                 .second = 20,
                                 .offsetFromUTC = {}};
  const std::string name = makeSummaryFileName({time, text, "haptics"});
  require(name.size() <= 255 && name.find('/') == std::string::npos);
  for (const char letter : name) require(static_cast<unsigned char>(letter) >= 0x20);
  const auto parts = tools::parseSummaryName(name);
  if (text.empty()) return;
  require(parts.has_value() && parts->service == "haptics" && !parts->application.empty());
  require(parts->secondsSince1970 == 1'700'000'000);
  require(!platform::linux_::isUtf8WithoutNul(text) || platform::linux_::isUtf8WithoutNul(name));
}

void checkSummary(std::span<const std::uint8_t> bytes) {
  const fuzzing::InputFile file(bytes);
  std::uint64_t messages = 0;
  const auto totals = tools::readSummary(
      file.path(), [&messages](std::string_view /*identifier*/, std::string_view message) {
        require(message.starts_with('{') && message.ends_with('}'));
        require(message.find('\n') == std::string_view::npos);
        ++messages;
      });
  if (totals) {
    require(totals->messages == messages);
  } else {
    require(!totals.error().message.empty());
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  checkName({reinterpret_cast<const char*>(data), size});
  checkSummary({data, size});
  return 0;
}
