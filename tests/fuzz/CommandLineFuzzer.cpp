// Parses arbitrary bytes as the values that people give on a command line and in scripts, and as
// addresses of a bus. What can be printed must be read again with the same result.
//
// Regular expressions are left out: the C library's own compiler of them can take minutes for a
// short pattern, and people only give them to themselves.

#include <cmath>
#include <cstdint>
#include <string>
#include <string_view>

#include "platform/linux/connection/BusAddress.h"
#include "tests/fuzz/InputFile.h"
#include "tools/Arguments.h"
#include "tools/Globs.h"
#include "tools/RowCursor.h"
#include "tools/Script.h"
#include "tools/TimeText.h"

namespace {

using namespace halvox;
using fuzzing::require;

constexpr double kNow = 1'795'313'222.5;

void checkTimes(std::string_view text) {
  if (const auto time = tools::parseTime(text, kNow)) {
    require(std::isfinite(*time));
    static_cast<void>(tools::localTime(*time));
    static_cast<void>(tools::utcClockTime(*time));
  } else {
    require(!time.error().message.empty());
  }
  if (const auto day = tools::parseDay(text, kNow)) require(day->first < day->second);
}

void checkNumbers(std::string_view text) {
  static_cast<void>(tools::parseReporterID(text));
  static_cast<void>(tools::parseNumber(text));
  static_cast<void>(tools::parseCount(text));
  static_cast<void>(tools::parseCategory(text));
  static_cast<void>(tools::parseEventType(text));
  static_cast<void>(tools::parseServiceType(text));
  if (const auto seconds = tools::parseSeconds(text)) require(seconds->count() > 0);
}

void checkCursor(std::string_view text) {
  const auto cursor = tools::parseCursor(text);
  if (!cursor) return;
  const auto again = tools::parseCursor(tools::cursorText(*cursor));
  require(again.has_value() && *again == *cursor);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string bytes(reinterpret_cast<const char*>(data), size);
  checkTimes(bytes);
  checkNumbers(bytes);
  checkCursor(bytes);
  static_cast<void>(tools::splitLine(bytes));
  const std::size_t half = bytes.find('\n');
  if (half != std::string::npos) {
    static_cast<void>(tools::matchesAnyGlob({bytes.substr(0, half)}, bytes.substr(half + 1)));
  }
  for (const auto& socket : platform::linux_::parseBusAddress(bytes)) {
    require(!socket.name.empty());
  }
  return 0;
}
