#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <ostream>
#include <string>
#include <vector>

#include "tools/Command.h"

namespace halvox::tools {

// A request for the streams and sessions in the store. A member that is not set selects everything.
struct ShowStreams {
  std::vector<std::string> applications{};  // glob patterns
  std::vector<std::string> devices{};       // glob patterns, for descriptions and for node names
  std::optional<double> since{};            // seconds since 1970
  std::optional<double> until{};
  std::optional<std::uint64_t> last{};
  bool glitched = false;   // only those with an xrun
  std::string database{};  // empty: as the service's configuration says
};

// A request for the story of one stream.
struct ShowStream {
  std::int64_t id = 0;  // as the list shows it, or the session's
  std::string database{};
  // All moments of a stream are in memory at once. Further ones are counted.
  std::size_t mostMoments = 10'000;
};

// Prints a table of streams, newest last, or a JSON object on each line. A stream is selected by
// time if it began before `until` and had not ended at `since`. At a terminal the table fits its
// width. `outputDescriptor` is the descriptor of `out`.
ExitStatus showStreams(const ShowStreams& request, OutputForm form, std::ostream& out,
                       int outputDescriptor, std::ostream& errors);

// Prints what is known about one stream, and its moments in order. Several sessions may have had
// one session ID; they are shown one after the other.
ExitStatus showStream(const ShowStream& request, OutputForm form, std::ostream& out,
                      std::ostream& errors);

}  // namespace halvox::tools
