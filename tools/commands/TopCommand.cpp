#include <algorithm>
#include <cctype>
#include <chrono>
#include <memory>
#include <string>

#include "tools/Top.h"
#include "tools/commands/Commands.h"
#include "tools/commands/Selection.h"

namespace halvox::tools {
namespace {

using platform::linux_::Failure;
using platform::linux_::Result;
using std::chrono::milliseconds;

// "2", "2s", "500ms", "1min".
Result<milliseconds> parseInterval(std::string_view text) {
  constexpr milliseconds kShortest{100};
  constexpr milliseconds kLongest = std::chrono::hours(24);
  const std::size_t end = std::min(text.find_first_not_of("0123456789."), text.size());
  const std::string_view unit = text.substr(end);
  const double factor = unit.empty() || unit == "s" ? 1
                        : unit == "ms"              ? 0.001
                        : unit == "min"             ? 60
                                                    : 0;
  const auto number = parseSeconds(text.substr(0, end));
  const auto interval =
      number ? std::chrono::ceil<milliseconds>(*number * factor) : milliseconds(0);
  if (interval < kShortest || interval > kLongest) {
    return Failure<>{"\"" + std::string(text) +
                     "\" is not an interval; expected 100ms to 24h in seconds or with a unit, such "
                     "as 2, 0.5s, 500ms or 1min"};
  }
  return interval;
}

Result<TopSortKey> parseSortKey(std::string_view text) {
  if (const auto key = sortKeyOf(text)) return *key;
  return Failure<>{"\"" + std::string(text) +
                   "\" is not a key; expected xruns, app, device, volume or started"};
}

}  // namespace

void addTopCommand(CommandSet& commands) {
  const auto request = std::make_shared<ShowTop>();
  CLI::App& top = commands.add(
      {.name = "top",
       .summary = "Watch devices, streams and the service itself",
       .example = "halvoxctl top\n  halvoxctl top -b --interval 10s --count 6 --json",
       .details = "Keys: q quits, p pauses, s sorts by the next key, r reverses the order, the "
                  "arrows move through the streams, ? explains all keys and columns. Without a "
                  "terminal it prints one text, or with --json one object, after each interval.",
       .reach = CommandReach::kService});
  offerWords(addParsed(top, "--interval", request->interval, parseInterval,
                       "The time between two readings: 2s, 500ms, 1min (default: 2s)")
                 ->type_name("TIME"),
             {"500ms", "1s", "2s", "5s", "10s", "1min"});
  addParsed(top, "--count", request->count, parseCount, "End after N readings")->type_name("N");
  top.add_flag("-b,--batch", request->isBatch,
               "Print texts instead of a screen; also without a terminal");
  offerWords(addParsed(top, "--sort", request->sort, parseSortKey,
                       "Sort the streams by xruns, app, device, volume or started (default: xruns)")
                 ->type_name("KEY"),
             {"xruns", "app", "device", "volume", "started"});
  addDatabase(top, request->database);
  commands.onRun(
      top, [request] { return *request; }, showTop);
}

}  // namespace halvox::tools
